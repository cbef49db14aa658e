#include "nas/match/text_decoder.h"

#include <uchardet.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <memory>

#include "nas/base/utf8.h"

namespace nas {
namespace {

constexpr char kUtf8[] = "UTF-8";
constexpr char kWestern[] = "WINDOWS-1252";
// The longest beginning of a UTF-8 sequence that is none yet.
constexpr size_t kMostCut = 3;

// Up to the first byte beyond ASCII.
size_t AsciiPrefix(std::string_view text) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080U;
  size_t at = 0;
  for (std::uint64_t word = 0; at + sizeof word <= text.size(); at += sizeof word) {
    std::memcpy(&word, text.data() + at, sizeof word);
    if ((word & kHighBits) != 0) break;
  }
  while (at < text.size() && static_cast<signed char>(text[at]) >= 0) ++at;
  return at;
}

// Whether more bytes could make a sequence of these few, which are none.
bool MayGoOn(std::string_view end) {
  const auto lead = static_cast<unsigned char>(end[0]);
  const size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  if (lead < 0xC2 || lead > 0xF4 || end.size() >= length) return false;
  return std::ranges::all_of(end.substr(1), [](char byte) { return (byte & 0xC0) == 0x80; });
}

}  // namespace

TextMark FindTextMark(std::string_view beginning) {
  static constexpr std::pair<std::string_view, const char*> kMarks[] = {
      {"\xEF\xBB\xBF", nullptr}, {"\xFF\xFE", "UTF-16LE"}, {"\xFE\xFF", "UTF-16BE"}};
  for (const auto& [mark, encoding] : kMarks) {
    if (beginning.starts_with(mark)) return {mark.size(), encoding};
  }
  return {};
}

std::string GuessEncoding(std::string_view sample) {
  const std::unique_ptr<uchardet, void (*)(uchardet_t)> detector(uchardet_new(), uchardet_delete);
  if (!detector || uchardet_handle_data(detector.get(), sample.data(), sample.size()) != 0) {
    return kWestern;
  }
  uchardet_data_end(detector.get());
  const std::string found = uchardet_get_charset(detector.get());
  if (found == kUtf8) return {};
  return found.empty() || found == "ASCII" ? kWestern : found;
}

size_t FindForeign(std::string_view text, size_t* cut) {
  *cut = 0;
  for (size_t at = AsciiPrefix(text); at < text.size(); at += AsciiPrefix(text.substr(at))) {
    const Utf8Step step = NextUtf8(text.substr(at));
    if (!step.valid) {
      if (text.size() - at > kMostCut || !MayGoOn(text.substr(at))) return at;
      *cut = text.size() - at;
      break;
    }
    at += step.length;
  }
  return std::string_view::npos;
}

std::optional<TextDecoder> TextDecoder::For(const std::string& encoding) {
  const iconv_t conversion = iconv_open(kUtf8, encoding.c_str());
  if (conversion == kNone) return std::nullopt;
  return TextDecoder(conversion);
}

TextDecoder::~TextDecoder() {
  if (conversion_ != kNone) iconv_close(conversion_);
}

size_t TextDecoder::Decode(std::string_view bytes, char* out) {
  std::string joined;
  if (!pending_.empty()) {
    joined = std::exchange(pending_, {}).append(bytes);
    bytes = joined;
  }
  char* const begin = out;
  char* from = const_cast<char*>(bytes.data());  // which iconv does not change
  size_t left = bytes.size();
  while (left > 0) {
    size_t room = kGrowth * (left + 1);
    if (iconv(conversion_, &from, &left, &out, &room) != static_cast<size_t>(-1)) break;
    if (errno == EINVAL && left < kMostPending) {
      pending_.assign(from, left);
      break;
    }
    out = std::ranges::copy(kReplacementCharacter, out).out;
    ++from;
    --left;
  }
  return static_cast<size_t>(out - begin);
}

size_t TextDecoder::Finish(char* out) {
  char* const begin = out;
  size_t room = kMostPending;
  iconv(conversion_, nullptr, nullptr, &out, &room);
  return static_cast<size_t>(out - begin);
}

}  // namespace nas
