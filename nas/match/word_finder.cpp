#include "nas/match/word_finder.h"

#include <bit>
#include <cstdint>
#include <cstring>

#if defined(__x86_64__)
#include <immintrin.h>
#endif

namespace nas {
namespace {

bool IsOfWord(char c) {
  return (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || static_cast<unsigned char>(c) >= 0x80;
}

size_t FindPlainly(std::string_view in, size_t from, std::string_view word) {
  while ((from = in.find(word, from)) != std::string_view::npos) {
    if (StandsByItself(in, from, word.size())) return from;
    ++from;
  }
  return from;
}

#if defined(__x86_64__)
// The sign bit of each of 32 bytes: whether it is one of a word.
[[gnu::target("avx2")]] inline __m256i OfWord(const char* at) {
  const __m256i bytes = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(at));
  const auto within = [&](char first, char last) __attribute__((target("avx2"))) {
    const __m256i behind = _mm256_sub_epi8(bytes, _mm256_set1_epi8(first));
    const __m256i most = _mm256_set1_epi8(static_cast<char>(last - first));
    return _mm256_cmpeq_epi8(_mm256_min_epu8(behind, most), behind);
  };
  return _mm256_or_si256(bytes, _mm256_or_si256(within('a', 'z'), within('0', '9')));
}

// A step looks at 32 places, each with a byte before and one behind it.
[[gnu::target("avx2")]] size_t FindWide(std::string_view in, size_t from, std::string_view word) {
  constexpr size_t kWidth = 32;
  const __m256i first = _mm256_set1_epi8(word.front());
  const __m256i last = _mm256_set1_epi8(word.back());
  if (from == 0) {
    if (in.starts_with(word) && StandsByItself(in, 0, word.size())) return 0;
    from = 1;
  }
  for (; from + kWidth + word.size() <= in.size(); from += kWidth) {
    const char* const at = in.data() + from;
    const auto* a = reinterpret_cast<const __m256i*>(at);
    const auto* b = reinterpret_cast<const __m256i*>(at + word.size() - 1);
    const __m256i fits = _mm256_and_si256(_mm256_cmpeq_epi8(_mm256_loadu_si256(a), first),
                                          _mm256_cmpeq_epi8(_mm256_loadu_si256(b), last));
    if (_mm256_testz_si256(fits, fits) != 0) continue;
    const __m256i within = _mm256_or_si256(OfWord(at - 1), OfWord(at + word.size()));
    auto places = static_cast<std::uint32_t>(_mm256_movemask_epi8(fits)) &
                  ~static_cast<std::uint32_t>(_mm256_movemask_epi8(within));
    for (; places != 0; places &= places - 1) {
      const size_t place = from + static_cast<size_t>(std::countr_zero(places));
      if (std::memcmp(in.data() + place, word.data(), word.size()) == 0) return place;
    }
  }
  return FindPlainly(in, from, word);
}
#endif

}  // namespace

bool StandsByItself(std::string_view text, size_t at, size_t size) {
  const size_t end = at + size;
  if (at > 0 && IsOfWord(text[at - 1])) return false;
  return end == text.size() || !IsOfWord(text[end]);
}

size_t WordFinder::Find(std::string_view in, size_t from) const {
#if defined(__x86_64__)
  static const bool wide = __builtin_cpu_supports("avx2") != 0;
  if (wide && from <= in.size()) return FindWide(in, from, word_);
#endif
  return FindPlainly(in, from, word_);
}

}  // namespace nas
