#include "nas/match/folded_name.h"

#include <utf8proc.h>

#include <cstdint>
#include <cstring>
#include <vector>

namespace nas {
namespace {

// Decomposes `text` into a buffer of the calling thread and composes it again under `options`.
// False where it is not valid UTF-8; `out` is then untouched.
bool Normalise(std::string_view text, utf8proc_option_t options, std::string& out) {
  constexpr size_t kUsualPoints = 512;  // most names once taken apart; longer ones make it grow
  thread_local std::vector<utf8proc_int32_t> points(kUsualPoints);
  const auto* bytes = reinterpret_cast<const utf8proc_uint8_t*>(text.data());
  const auto count = static_cast<utf8proc_ssize_t>(text.size());
  utf8proc_ssize_t needed;
  while ((needed = utf8proc_decompose(bytes, count, points.data(),
                                      static_cast<utf8proc_ssize_t>(points.size()), options)) >
         static_cast<utf8proc_ssize_t>(points.size())) {
    points.resize(static_cast<size_t>(needed));
  }
  if (needed < 0) return false;
  const utf8proc_ssize_t composed = utf8proc_normalize_utf32(points.data(), needed, options);
  if (composed < 0) return false;
  constexpr size_t kLongestCodePoint = 4;
  out.resize(static_cast<size_t>(composed) * kLongestCodePoint);
  size_t length = 0;
  for (utf8proc_ssize_t i = 0; i < composed; ++i) {
    length += static_cast<size_t>(utf8proc_encode_char(
        points[static_cast<size_t>(i)], reinterpret_cast<utf8proc_uint8_t*>(out.data() + length)));
  }
  out.resize(length);
  return true;
}

constexpr auto kFold =
    static_cast<utf8proc_option_t>(UTF8PROC_STABLE | UTF8PROC_COMPOSE | UTF8PROC_CASEFOLD);
constexpr auto kCompose = static_cast<utf8proc_option_t>(UTF8PROC_STABLE | UTF8PROC_COMPOSE);

// Lowers the ASCII letters of `text` into `out`; returns whether all of it is ASCII. Written
// without branches so that the compiler turns it into vector code.
bool LowerInto(std::string_view text, std::string& out) {
  out.resize(text.size());
  char* to = out.data();
  unsigned char seen = 0;
  for (size_t i = 0; i < text.size(); ++i) {
    const auto c = static_cast<unsigned char>(text[i]);
    seen |= c;
    to[i] = static_cast<char>(c + ((c >= 'A' && c <= 'Z') ? 'a' - 'A' : 0));
  }
  return seen < 0x80;
}

}  // namespace

bool IsAscii(std::string_view text) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080;
  std::uint64_t seen = 0;
  size_t i = 0;
  for (std::uint64_t word; i + sizeof(word) <= text.size(); i += sizeof(word)) {
    std::memcpy(&word, text.data() + i, sizeof(word));
    seen |= word;
  }
  for (; i < text.size(); ++i) seen |= static_cast<unsigned char>(text[i]);
  return (seen & kHighBits) == 0;
}

bool MayFoldToAscii(std::string_view text) {
  if (IsAscii(text)) return false;
  for (size_t i = 0; i + 1 < text.size(); ++i) {
    const auto next = static_cast<unsigned char>(text[i + 1]);
    switch (static_cast<unsigned char>(text[i])) {
      case 0xc3:
        if (next == 0x9f) return true;  // sharp s
        break;
      case 0xc4:
        if (next == 0xb0) return true;  // capital i with dot
        break;
      case 0xc5:
        if (next == 0x89 || next == 0xbf) return true;  // n with apostrophe, long s
        break;
      case 0xc7:
        if (next == 0xb0) return true;  // j with caron
        break;
      case 0xcd:
        if (next == 0xbe) return true;  // Greek question mark
        break;
      case 0xe1:
        if (next == 0xba || next == 0xbf) return true;  // letters with marks below, Greek marks
        break;
      case 0xe2:
        if (next == 0x84) return true;  // Kelvin sign
        break;
      case 0xef:
        if (next == 0xac) return true;  // ligatures
        break;
      default:
        break;
    }
  }
  return false;
}

std::string AsciiLower(std::string_view text) {
  std::string lowered;
  LowerInto(text, lowered);
  return lowered;
}

std::string FoldText(std::string_view text, bool* valid) {
  std::string folded;
  bool is_valid = true;
  if (!LowerInto(text, folded)) is_valid = Normalise(text, kFold, folded);
  if (valid != nullptr) *valid = is_valid;
  return folded;
}

std::string ComposeText(std::string_view text) {
  std::string composed;
  if (IsAscii(text) || !Normalise(text, kCompose, composed)) composed = text;
  return composed;
}

void FoldedName::Fold() {
  if (LowerInto(name_, folded_)) {
    state_ = State::kAscii;
  } else {
    state_ = Normalise(name_, kFold, folded_) ? State::kUtf8 : State::kBroken;
  }
}

}  // namespace nas
