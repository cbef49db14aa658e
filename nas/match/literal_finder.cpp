#include "nas/match/literal_finder.h"

#include <cstdint>
#include <cstring>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

using Vector = unsigned char __attribute__((vector_size(16)));

Vector Load(const char* at) {
  Vector v;
  std::memcpy(&v, at, sizeof(v));
  return v;
}

bool AnySet(Vector v) {
  std::uint64_t words[2];
  std::memcpy(words, &v, sizeof(v));
  return (words[0] | words[1]) != 0;
}

// How common a byte is in texts and program sources, both cases of a letter together: the lower the
// rarer.
int Frequency(char lowered) {
  constexpr std::string_view kCommonFirst = " etaoinsrlducpmhgf_.,-yb()w;=v*/k>\n\t\"x0:1";
  const size_t at = kCommonFirst.find(lowered);
  return at == std::string_view::npos ? 0 : static_cast<int>(kCommonFirst.size() - at);
}

}  // namespace

LiteralFinder::LiteralFinder(std::string_view text) : lowered_(AsciiLower(text)) {
  size_t first = 0;
  for (size_t i = 1; i < lowered_.size(); ++i) {
    if (Frequency(lowered_[i]) < Frequency(lowered_[first])) first = i;
  }
  size_t second = first == 0 ? lowered_.size() - 1 : 0;
  for (size_t i = 0; i < lowered_.size(); ++i) {
    if (i != first && Frequency(lowered_[i]) < Frequency(lowered_[second])) second = i;
  }
  first_ = MakeProbe(first);
  second_ = MakeProbe(second);
}

LiteralFinder::Probe LiteralFinder::MakeProbe(size_t offset) const {
  const char c = lowered_[offset];
  const bool letter = c >= 'a' && c <= 'z';
  return {offset, static_cast<unsigned char>(letter ? 0x20 : 0), static_cast<unsigned char>(c)};
}

bool LiteralFinder::MatchesAt(const char* at) const {
  for (size_t i = 0; i < lowered_.size(); ++i) {
    const char c = at[i];
    const char lower = c >= 'A' && c <= 'Z' ? static_cast<char>(c + ('a' - 'A')) : c;
    if (lower != lowered_[i]) return false;
  }
  return true;
}

std::optional<TextPlace> LiteralFinder::Find(std::string_view buffer) const {
  if (buffer.size() < lowered_.size()) return std::nullopt;
  const char* at = buffer.data();
  const char* const last = at + (buffer.size() - lowered_.size());  // last possible place
  const auto place = [&](const char* found) {
    return TextPlace{static_cast<size_t>(found - buffer.data()), lowered_.size()};
  };
  const auto fits = [this](const char* start) {
    return first_.Fits(start[first_.offset]) && second_.Fits(start[second_.offset]) &&
           MatchesAt(start);
  };
  const auto hits = [this](const char* start) -> Vector {
    return ((Load(start + first_.offset) | first_.mask) == first_.value) &
           ((Load(start + second_.offset) | second_.mask) == second_.value);
  };
  // The places at .. at + 15 are all possible ones, so every byte that is loaded is in the buffer.
  constexpr std::ptrdiff_t kPlaces = sizeof(Vector);
  for (; last - at >= kPlaces - 1; at += kPlaces) {
    // Most of a text is passed by four at once: asking whether any has hits takes as long as a
    // look.
    while (
        last - at >= 4 * kPlaces - 1 &&
        !AnySet(hits(at) | hits(at + kPlaces) | hits(at + 2 * kPlaces) | hits(at + 3 * kPlaces))) {
      at += 4 * kPlaces;
    }
    if (last - at < kPlaces - 1) break;
    if (!AnySet(hits(at))) continue;
    for (std::ptrdiff_t i = 0; i < kPlaces; ++i) {
      if (fits(at + i)) return place(at + i);
    }
  }
  for (; at <= last; ++at) {
    if (fits(at)) return place(at);
  }
  return std::nullopt;
}

}  // namespace nas
