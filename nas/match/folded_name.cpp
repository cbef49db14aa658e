#include "nas/match/folded_name.h"

#include <utf8proc.h>

#include <array>
#include <cstdint>
#include <cstring>
#include <vector>

namespace nas {
namespace {

bool IsWithin(utf8proc_int32_t point, utf8proc_int32_t first, utf8proc_int32_t last) {
  return first <= point && point <= last;
}

bool IsMark(utf8proc_int32_t point) {
  return IsWithin(point, 0x300, 0x36f) || IsWithin(point, 0x483, 0x487) ||
         IsWithin(point, 0x1ab0, 0x1aff) || IsWithin(point, 0x1dc0, 0x1dff) ||
         IsWithin(point, 0xfe20, 0xfe2f);
}

// A letter of Latin, Greek or Cyrillic, folded and decomposed.
bool TakesAccents(utf8proc_int32_t point) {
  return IsWithin(point, 'a', 'z') || IsWithin(point, 0xaa, 0x24f) ||
         IsWithin(point, 0x250, 0x2af) || IsWithin(point, 0x370, 0x52f) ||
         IsWithin(point, 0x1c80, 0x1c8f) || IsWithin(point, 0x1d00, 0x1dbf) ||
         IsWithin(point, 0x1e00, 0x1fff) || IsWithin(point, 0x2c60, 0x2c7f) ||
         IsWithin(point, 0xa640, 0xa69f) || IsWithin(point, 0xa720, 0xa7ff) ||
         IsWithin(point, 0xab30, 0xab6f);
}

// Takes the marks on letters that take accents out of decomposed points; returns how many are left.
utf8proc_ssize_t DropAccents(utf8proc_int32_t* points, utf8proc_ssize_t count) {
  utf8proc_ssize_t kept = 0;
  bool on_letter = false;
  for (utf8proc_ssize_t i = 0; i < count; ++i) {
    const bool mark = IsMark(points[i]);
    if (!mark) on_letter = TakesAccents(points[i]);
    if (!(mark && on_letter)) points[kept++] = points[i];
  }
  return kept;
}

// Decomposes `text` into a buffer of the calling thread and composes it again under `options`,
// without accents where that is asked for. False where it is not valid UTF-8; `out` is then
// untouched.
bool Normalise(std::string_view text, utf8proc_option_t options, std::string& out,
               bool drop_accents = false) {
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
  if (drop_accents) needed = DropAccents(points.data(), needed);
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

std::string FoldVersion() {
  // Changes with what this file does to a name.
  constexpr char kRules[] = "1-unicode-";
  return std::string(kRules) + utf8proc_unicode_version();
}

bool IsAscii(std::string_view text) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080;
  std::uint64_t seen = 0;
  std::uint64_t word = 0;
  if (text.size() < sizeof(word)) {
    for (const char c : text) seen |= static_cast<unsigned char>(c);
    return (seen & kHighBits) == 0;
  }
  for (size_t i = 0; i + sizeof(word) < text.size(); i += sizeof(word)) {
    std::memcpy(&word, text.data() + i, sizeof(word));
    seen |= word;
  }
  std::memcpy(&word, text.data() + text.size() - sizeof(word), sizeof(word));
  return ((seen | word) & kHighBits) == 0;
}

bool MayFoldToAscii(std::string_view text) {
  if (IsAscii(text)) return false;
  for (size_t i = 0; i + 1 < text.size(); ++i) {
    const auto lead = static_cast<unsigned char>(text[i]);
    const auto next = static_cast<unsigned char>(text[i + 1]);
    if (lead < 0xc3) continue;
    if (lead <= 0xcd) {
      // Letters with accents, the sharp s and the long one; behind a few others, marks.
      if (lead <= 0xc9 || lead >= 0xcc) return true;
    } else if (lead == 0xd2) {
      if (next >= 0x83 && next <= 0x87) return true;  // Cyrillic marks
    } else if (lead == 0xe1) {
      if (next == 0xaa || next == 0xab) return true;  // marks
      if (next >= 0xb7) return true;                  // marks, letters with them, Greek marks
    } else if (lead == 0xe2) {
      if (next == 0x84) return true;  // the signs of Kelvin and Angstrom
    } else if (lead == 0xef) {
      if (next == 0xac || next == 0xb8) return true;  // ligatures; halves of marks
    }
  }
  return false;
}

namespace {

constexpr char kOtherLetter = '\x80';

// What becomes of each character from U+00C0 to U+017F, which two bytes stand for.
using Skeletons = std::array<std::string, 0x180 - 0xc0>;

Skeletons MakeSkeletons() {
  Skeletons all;
  for (size_t i = 0; i < all.size(); ++i) {
    const size_t point = 0xc0 + i;
    const char bytes[] = {static_cast<char>(0xc0 | (point >> 6)),
                          static_cast<char>(0x80 | (point & 0x3f))};
    for (const char c : WithoutAccents(FoldText({bytes, sizeof bytes}))) {
      all[i] += static_cast<signed char>(c) < 0 ? kOtherLetter : c;
    }
  }
  return all;
}

}  // namespace

bool AsciiSkeleton(std::string_view text, std::string& out) {
  static const Skeletons skeletons = MakeSkeletons();
  out.clear();
  for (size_t i = 0; i < text.size(); ++i) {
    const auto c = static_cast<unsigned char>(text[i]);
    if (c < 0x80) {
      out += static_cast<char>(c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c);
      continue;
    }
    const auto next = static_cast<unsigned char>(i + 1 < text.size() ? text[i + 1] : 0);
    const bool pair = (next & 0xc0) == 0x80;
    if (pair && c >= 0xc3 && c <= 0xc5) {
      out += skeletons[static_cast<size_t>(((c & 0x1f) << 6) + (next & 0x3f) - 0xc0)];
      ++i;
    } else if (pair && (c == 0xcc || (c == 0xcd && next < 0xb0))) {
      ++i;  // a mark
    } else if (MayFoldToAscii(text.substr(i, 3))) {
      return false;
    } else {
      out += kOtherLetter;
    }
  }
  return true;
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

std::string WithoutAccents(std::string_view folded) {
  std::string plain;
  if (IsAscii(folded) || !Normalise(folded, kCompose, plain, true)) plain = folded;
  return plain;
}

namespace {

// How many bytes the character at the front of `text` has, where it is a common one that is
// composed and neither composes with another such nor is taken apart; else 0. Those are Latin,
// Greek, Cyrillic, Hebrew and Arabic letters, kana, ideographs and Hangul syllables.
size_t PlainCharacter(std::string_view text) {
  const auto byte = [text](size_t at) {
    return at < text.size() ? static_cast<unsigned char>(text[at]) : 0U;
  };
  const auto follows = [&byte](size_t at) { return (byte(at) & 0xc0) == 0x80; };
  const unsigned lead = byte(0);
  const unsigned next = byte(1);
  if (lead < 0x80) return 1;
  const bool greek = (lead == 0xce && next != 0x87) || lead == 0xcf;
  const bool hebrew = lead == 0xd7 && next >= 0x90 && next <= 0xaa;
  const bool arabic = (lead == 0xd8 && next >= 0xa0) || (lead == 0xd9 && next <= 0x8a);
  if ((lead >= 0xc2 && lead <= 0xcb) || lead == 0xd0 || lead == 0xd1 || greek || hebrew || arabic) {
    return follows(1) ? 2 : 0;
  }
  if (!follows(1) || !follows(2)) return 0;
  const bool kana = lead == 0xe3 && next >= 0x81 && next <= 0x83;
  const bool mark = next == 0x82 && (byte(2) == 0x99 || byte(2) == 0x9a);
  const bool ideograph = lead >= 0xe4 && lead <= 0xe9;
  const bool syllable = (lead == 0xea && next >= 0xb0) || lead == 0xeb || lead == 0xec ||
                        (lead == 0xed && next <= 0x9d);
  return (kana && !mark) || ideograph || syllable ? 3 : 0;
}

}  // namespace

namespace {

// Behind the ASCII characters that begin at `at`.
size_t BehindAscii(std::string_view text, size_t at) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080;
  std::uint64_t word = 0;
  for (; at + sizeof(word) <= text.size(); at += sizeof(word)) {
    std::memcpy(&word, text.data() + at, sizeof(word));
    if ((word & kHighBits) != 0) break;
  }
  while (at < text.size() && static_cast<unsigned char>(text[at]) < 0x80) ++at;
  return at;
}

// Behind the characters from `at` on that are sure to be composed.
size_t BehindPlain(std::string_view text, size_t at) {
  for (size_t bytes = 1; bytes != 0 && (at = BehindAscii(text, at)) < text.size(); at += bytes) {
    bytes = PlainCharacter(text.substr(at));
  }
  return at;
}

// What a letter in ASCII and the mark behind it, U+0300 to U+036F, become together.
class MarkedLetters {
 public:
  // Empty where the mark that begins at `at` is none of those, or makes no one character with what
  // stands before it.
  std::string_view Find(std::string_view text, size_t at) {
    if (at == 0 || text.size() - at < 2) return {};
    const auto letter = static_cast<unsigned char>(text[at - 1]);
    const unsigned mark =
        (static_cast<unsigned char>(text[at]) << 8U) | static_cast<unsigned char>(text[at + 1]);
    constexpr unsigned kFirstMark = 0xcc80;
    constexpr unsigned kLastMark = 0xcdaf;
    if (letter >= kLetters || mark < kFirstMark || mark > kLastMark) return {};
    Together& together = all_[letter * kMarks + (mark - kFirstMark)];
    if (!together.known) Learn(text.substr(at - 1, 3), together);
    return {together.bytes.data(), together.size};
  }

 private:
  static constexpr size_t kLetters = 0x80;
  static constexpr size_t kMarks = 0x130;
  struct Together {
    bool known = false;
    unsigned char size = 0;
    std::array<char, 3> bytes = {};
  };

  static void Learn(std::string_view text, Together& together) {
    std::string composed;
    together.known = true;
    if (!Normalise(text, kCompose, composed) || composed.size() > together.bytes.size()) return;
    if (utf8proc_ssize_t(composed.size()) != OneCharacter(composed)) return;
    together.size = static_cast<unsigned char>(composed.copy(together.bytes.data(), 3));
  }
  // How many bytes the first character has.
  static utf8proc_ssize_t OneCharacter(const std::string& text) {
    utf8proc_int32_t point = 0;
    return utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t*>(text.data()),
                            static_cast<utf8proc_ssize_t>(text.size()), &point);
  }

  std::vector<Together> all_ = std::vector<Together>(kLetters * kMarks);
};

}  // namespace

bool IsComposed(std::string_view text) { return BehindPlain(text, 0) == text.size(); }

// Letters and marks come apart from what is sure to be composed as it is, so one pass over most
// names makes them as the general way would.
bool AppendComposed(std::string_view text, std::string* out) {
  const size_t begin = out->size();
  size_t copied = 0;
  size_t at = 0;
  while ((at = BehindPlain(text, at)) < text.size()) {
    thread_local MarkedLetters letters;
    const std::string_view together = letters.Find(text, at);
    if (together.empty()) {
      out->resize(begin);
      std::string composed;
      if (!Normalise(text, kCompose, composed)) return false;
      out->append(composed);
      return true;
    }
    out->append(text.substr(copied, at - 1 - copied)).append(together);
    copied = at += 2;
  }
  out->append(text.substr(copied));
  return true;
}

std::string ComposeText(std::string_view text) {
  std::string composed;
  if (!AppendComposed(text, &composed)) composed = text;
  return composed;
}

void FoldedName::Fold() {
  if (LowerInto(name_, buffer_)) {
    state_ = State::kAscii;
  } else {
    state_ = Normalise(name_, kFold, buffer_) ? State::kUtf8 : State::kBroken;
  }
  folded_ = buffer_;
}

}  // namespace nas
