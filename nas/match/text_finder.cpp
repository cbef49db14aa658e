#include "nas/match/text_finder.h"

#include <bit>
#include <cstdint>
#include <cstring>

#if defined(__x86_64__)
#include <immintrin.h>
#endif

namespace nas {
namespace {

// How common a byte is in names: the lower the rarer.
size_t Frequency(char c) {
  constexpr std::string_view kCommonFirst = "eaitronslc_0123-dpgmhu.456789fby wkvjxzq";
  const size_t at = kCommonFirst.find(c);
  return at == std::string_view::npos ? 0 : kCommonFirst.size() - at;
}

struct Wanted {
  const char* text;
  size_t size;
  size_t first;
  size_t second;
  bool FitsAt(const char* at) const { return std::memcmp(at, text, size) == 0; }
};

// Looks at [at, last] for the place of the text; null where there is none.
const char* FindPlainly(const char* at, const char* last, const Wanted& wanted) {
  const char first = wanted.text[wanted.first];
  while (at <= last) {
    const void* found = std::memchr(at + wanted.first, first, static_cast<size_t>(last - at) + 1);
    if (found == nullptr) return nullptr;
    at = static_cast<const char*>(found) - wanted.first;
    if (wanted.FitsAt(at)) return at;
    ++at;
  }
  return nullptr;
}

#if defined(__x86_64__)
// A step looks at 64 places. Every byte that it loads lies before the end of the last of them.
[[gnu::target("avx2")]] const char* FindWide(const char* at, const char* last,
                                             const Wanted& wanted) {
  constexpr std::ptrdiff_t kWidth = 32;
  const __m256i first = _mm256_set1_epi8(wanted.text[wanted.first]);
  const __m256i second = _mm256_set1_epi8(wanted.text[wanted.second]);
  const auto hits = [&](const char* from) __attribute__((target("avx2"))) {
    const auto* a = reinterpret_cast<const __m256i*>(from + wanted.first);
    const auto* b = reinterpret_cast<const __m256i*>(from + wanted.second);
    return _mm256_and_si256(_mm256_cmpeq_epi8(_mm256_loadu_si256(a), first),
                            _mm256_cmpeq_epi8(_mm256_loadu_si256(b), second));
  };
  for (; last - at >= 2 * kWidth - 1; at += 2 * kWidth) {
    const __m256i low = hits(at);
    const __m256i high = hits(at + kWidth);
    if (_mm256_testz_si256(_mm256_or_si256(low, high), _mm256_set1_epi8(-1)) != 0) continue;
    auto places =
        static_cast<std::uint64_t>(static_cast<std::uint32_t>(_mm256_movemask_epi8(low))) |
        static_cast<std::uint64_t>(static_cast<std::uint32_t>(_mm256_movemask_epi8(high)))
            << kWidth;
    for (; places != 0; places &= places - 1) {
      const char* const place = at + std::countr_zero(places);
      if (wanted.FitsAt(place)) return place;
    }
  }
  return FindPlainly(at, last, wanted);
}
#endif

using Finder = const char* (*)(const char*, const char*, const Wanted&);

Finder ChooseFinder() {
#if defined(__x86_64__)
  if (__builtin_cpu_supports("avx2")) return FindWide;
#endif
  return FindPlainly;
}

}  // namespace

TextFinder::TextFinder(std::string_view text) : text_(text) {
  for (size_t i = 1; i < text_.size(); ++i) {
    if (Frequency(text_[i]) < Frequency(text_[first_])) first_ = i;
  }
  second_ = first_ == 0 ? text_.size() - 1 : 0;
  for (size_t i = 0; i < text_.size(); ++i) {
    if (i != first_ && Frequency(text_[i]) < Frequency(text_[second_])) second_ = i;
  }
}

size_t TextFinder::Find(std::string_view in, size_t from) const {
  static const Finder finder = ChooseFinder();
  if (from > in.size() || in.size() - from < text_.size()) return std::string_view::npos;
  const char* const last = in.data() + (in.size() - text_.size());
  const char* const place =
      finder(in.data() + from, last, {text_.data(), text_.size(), first_, second_});
  return place == nullptr ? std::string_view::npos : static_cast<size_t>(place - in.data());
}

}  // namespace nas
