#pragma once
// The encodings that texts are found in besides UTF-8, and their decoding. UTF-16 is told by the
// mark at a file's beginning; a legacy encoding can only be guessed.

#include <iconv.h>

#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace nas {

// The mark that a file begins with.
struct TextMark {
  size_t bytes = 0;                // 0: none
  const char* encoding = nullptr;  // null: UTF-8
};
TextMark FindTextMark(std::string_view beginning);

// The name of the encoding that `sample`, which is not UTF-8, is most likely in; a Western European
// one where nothing speaks for another. Empty where the sample is rather UTF-8 with damages.
std::string GuessEncoding(std::string_view sample);

// Bytes that are not UTF-8, whatever comes before and after them: where they begin, or npos. A
// sequence that the end of the text cuts is not among them, but counted in `cut`.
size_t FindForeign(std::string_view text, size_t* cut);

// Decodes one text, piece after piece.
class TextDecoder {
 public:
  // No byte becomes more than this many of UTF-8.
  static constexpr size_t kGrowth = 3;

  // Nothing where the encoding is not known here.
  static std::optional<TextDecoder> For(const std::string& encoding);
  ~TextDecoder();
  TextDecoder(TextDecoder&& other) noexcept
      : conversion_(std::exchange(other.conversion_, kNone)), pending_(std::move(other.pending_)) {}
  TextDecoder& operator=(TextDecoder&&) = delete;

  // Writes `bytes` as UTF-8 to `out`, which has room for kGrowth times as many and what was pending
  // (kMostPending), and returns how many were written. What is no character becomes U+FFFD; one
  // that the end of a piece cuts is pending until the next.
  size_t Decode(std::string_view bytes, char* out);
  // Writes what was held back until the next character, with which it might have become one, as
  // Hebrew letters and their points do; at the text's end, into room for kMostPending.
  size_t Finish(char* out);
  static constexpr size_t kMostPending = 16;

 private:
  static inline const iconv_t kNone = reinterpret_cast<iconv_t>(-1);
  explicit TextDecoder(iconv_t conversion) : conversion_(conversion) {}

  iconv_t conversion_;
  std::string pending_;
};

}  // namespace nas
