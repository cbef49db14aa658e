#pragma once
// Bytes in hexadecimal digits.

#include <string>
#include <string_view>

namespace nas {

inline constexpr std::string_view kLowerHex = "0123456789abcdef";
inline constexpr std::string_view kUpperHex = "0123456789ABCDEF";

// Appends the byte's two digits, out of one of the sets above.
inline void AppendHex(unsigned char byte, std::string_view digits, std::string* out) {
  *out += digits[byte >> 4];
  *out += digits[byte & 0xF];
}

// The value of a digit in either case; -1 for another character.
inline int HexValue(char digit) {
  for (const std::string_view digits : {kLowerHex, kUpperHex}) {
    if (const size_t value = digits.find(digit); value != std::string_view::npos) {
      return static_cast<int>(value);
    }
  }
  return -1;
}

}  // namespace nas
