#include "nas/match/near_text.h"

#include <algorithm>

namespace nas {

NearText::NearText(std::string_view word) : length_(word.size()) {
  for (size_t i = 0; i < length_; ++i) {
    places_[static_cast<unsigned char>(word[i])] |= std::uint64_t{1} << i;
  }
}

// The columns of the usual table of distances, each kept as the bits of its steps up and down.
size_t NearText::Distance(std::string_view text) const {
  std::uint64_t up = ~std::uint64_t{0};
  std::uint64_t down = 0;
  const std::uint64_t last = std::uint64_t{1} << (length_ - 1);
  size_t distance = length_;
  size_t least = length_;
  for (const char c : text) {
    const std::uint64_t same = places_[static_cast<unsigned char>(c)];
    const std::uint64_t diagonal = (((same & up) + up) ^ up) | same | down;
    std::uint64_t right_up = down | ~(diagonal | up);
    const std::uint64_t right_down = up & diagonal;
    if (right_up & last) ++distance;
    if (right_down & last) --distance;
    right_up <<= 1;  // the word may begin anywhere
    up = (right_down << 1) | ~((same | down) | right_up);
    down = right_up & (same | down);
    least = std::min(least, distance);
  }
  return least;
}

}  // namespace nas
