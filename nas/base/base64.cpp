#include "nas/base/base64.h"

#include <algorithm>
#include <cstdint>

namespace nas {

void AppendBase64(std::string_view bytes, std::string* out) {
  constexpr std::string_view kLetters =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  constexpr size_t kGroupBytes = 3;
  constexpr int kLetterBits = 6;
  constexpr int kByteBits = 8;
  for (; !bytes.empty(); bytes.remove_prefix(std::min(bytes.size(), kGroupBytes))) {
    std::uint32_t group = 0;
    for (size_t i = 0; i < kGroupBytes; ++i) {
      group = group << kByteBits | (i < bytes.size() ? static_cast<unsigned char>(bytes[i]) : 0U);
    }
    for (size_t i = 0; i <= kGroupBytes; ++i) {
      const auto letter = group >> (kLetterBits * (kGroupBytes - i)) & (kLetters.size() - 1);
      *out += i <= bytes.size() ? kLetters[letter] : '=';
    }
  }
}

}  // namespace nas
