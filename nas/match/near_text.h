#pragma once
// How near a text comes to a word: the fewest letters to change, add or leave out so that the text
// holds it. One step for each byte of the text.

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace nas {

class NearText {
 public:
  static constexpr size_t kLongest = 64;  // bytes of a word
  // `word` has 1 to kLongest bytes, in the form in which texts are compared.
  explicit NearText(std::string_view word);
  size_t Distance(std::string_view text) const;
  // Farther than this the texts have nothing to do with each other.
  size_t farthest() const { return length_ < kShort ? 1 : length_ / kLettersForEach; }

 private:
  static constexpr size_t kShort = 6;
  static constexpr size_t kLettersForEach = 3;

  size_t length_;
  std::array<std::uint64_t, 256> places_{};  // of each byte in the word, a bit each
};

}  // namespace nas
