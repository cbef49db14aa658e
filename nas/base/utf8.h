#pragma once
// Reading of text as UTF-8. Names on disk are bytes; what is sent to a client is always valid
// UTF-8, with U+FFFD in the place of what is not (JsonBytes::kClean). Nothing here fails or keeps
// state.

#include <cstddef>
#include <string_view>

namespace nas {

struct Utf8Step {
  size_t length;  // bytes taken, at least 1
  bool valid;     // false: these bytes are one bad sequence
};

// Looks at the sequence that `text`, which must not be empty, begins with. A bad sequence takes as
// many bytes as a valid one could have begun with, so that one broken character is replaced once.
// Surrogates, overlong forms and values beyond U+10FFFF are bad.
Utf8Step NextUtf8(std::string_view text);

// Whether no sequence in it is bad.
bool IsUtf8(std::string_view text);

// Whether the byte is one of ASCII's control characters.
constexpr bool IsControl(unsigned char byte) {
  constexpr unsigned char kFirstPrintable = 0x20;
  constexpr unsigned char kDelete = 0x7F;
  return byte < kFirstPrintable || byte == kDelete;
}

// What stands in the place of a bad sequence.
inline constexpr std::string_view kReplacementCharacter = "\xEF\xBF\xBD";

}  // namespace nas
