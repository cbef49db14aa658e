#pragma once
// Finds a text, byte for byte, in megabytes of other texts. Two of its bytes, those that seem the
// rarest in names, are compared with 64 places at once where the processor has AVX2, and with as
// many as the machine's common instructions take elsewhere.

#include <cstddef>
#include <string>
#include <string_view>

namespace nas {

// Does not change once made: any thread may ask.
class TextFinder {
 public:
  // `text` is not empty.
  explicit TextFinder(std::string_view text);
  // The first place of it at `from` or later; npos where there is none.
  size_t Find(std::string_view in, size_t from) const;

 private:
  std::string text_;
  size_t first_ = 0;  // places of the two bytes in it
  size_t second_ = 0;
};

}  // namespace nas
