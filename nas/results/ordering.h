#pragma once
// Sorting many rows by one column. Rows are numbers 0..n-1; an ordering lists them ascending, equal
// ones in the order of their numbers. There are fewer than 2^32. Pure functions of what they are
// given: any thread may call.

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/folded_name.h"

namespace nas {

using Ordering = std::vector<std::uint32_t>;

// Orders rows by their numbers `keys`.
Ordering OrderByNumber(const std::vector<std::uint64_t>& keys);
// The form of a signed number whose unsigned order is the same.
inline std::uint64_t UnsignedKey(std::int64_t value) {
  return static_cast<std::uint64_t>(value) ^ (std::uint64_t{1} << 63);
}

// Byte strings without NUL, one for each row, kept end to end.
class TextKeys {
 public:
  // Appends the natural key of `text` as the next row's: its byte order is natural order ignoring
  // case, with numbers by their value (IMG2 before IMG10) and letters folded.
  void AddNatural(std::string_view text);
  size_t size() const { return ends_.size(); }
  std::string_view operator[](size_t row) const {
    const size_t begin = row == 0 ? 0 : ends_[row - 1];
    return std::string_view(bytes_).substr(begin, ends_[row] - begin);
  }
  // Of all rows appended so far.
  Ordering Order() const;

 private:
  FoldedName folded_;
  std::string bytes_;
  std::vector<std::uint64_t> ends_;
};

// Position of each row in the ordering; with equal keys sharing one, where `keys` is given.
std::vector<std::uint32_t> Ranks(const Ordering& ordering, const TextKeys* keys = nullptr);

}  // namespace nas
