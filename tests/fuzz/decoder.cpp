// Bytes in other encodings than UTF-8: what is made of them is UTF-8 within its bound, wherever
// they are cut into pieces.

#include <algorithm>

#include "nas/base/utf8.h"
#include "nas/match/text_decoder.h"
#include "tests/fuzz/fuzz.h"

namespace {

using nas::TextDecoder;

// Decodes pieces of `step` bytes, each into just the room that it may take.
std::string Decoded(const std::string& encoding, std::string_view bytes, size_t step) {
  auto decoder = TextDecoder::For(encoding);
  if (!decoder) return {};
  std::string all;
  while (!bytes.empty()) {
    const std::string_view piece = bytes.substr(0, step);
    bytes.remove_prefix(piece.size());
    std::string out(TextDecoder::kGrowth * piece.size() + TextDecoder::kMostPending, '\0');
    const size_t written = decoder->Decode(piece, out.data());
    DEMAND(written <= out.size());
    all.append(out, 0, written);
  }
  std::string rest(TextDecoder::kMostPending, '\0');
  return all.append(rest, 0, decoder->Finish(rest.data()));
}

void CheckForeign(std::string_view bytes) {
  size_t cut = 0;
  const size_t at = nas::FindForeign(bytes, &cut);
  DEMAND(cut <= bytes.size());
  DEMAND((at == std::string_view::npos && cut == 0) == nas::IsUtf8(bytes));
  DEMAND(nas::IsUtf8(bytes.substr(0, std::min(at, bytes.size() - cut))));
}

}  // namespace

// A byte for the encoding, one for the pieces, and the text.
int fuzz::Target(std::string_view input) {
  static const std::string kEncodings[] = {
      "UTF-16LE",     "UTF-16BE",     "WINDOWS-1252", "WINDOWS-1251",     "WINDOWS-1255",
      "WINDOWS-1258", "VISCII",       "TIS-620",      "SHIFT_JIS",        "EUC-JP",
      "ISO-2022-JP",  "BIG5",         "GB18030",      "EUC-TW",           "UHC",
      "ISO-2022-KR",  "HZ-GB-2312",   "JOHAB",        "GEORGIAN-ACADEMY", "UTF-32LE",
      "IBM855",       "MAC-CYRILLIC", "KOI8-R",       "ISO-8859-8"};
  constexpr size_t kHead = 2;
  constexpr size_t kMostText = 4096;
  if (input.size() <= kHead || input.size() > kMostText) return kUseless;
  const auto choice = static_cast<unsigned char>(input[0]);
  const std::string& encoding = kEncodings[choice % std::size(kEncodings)];
  const size_t step = 1 + static_cast<unsigned char>(input[1]) % 32;
  const std::string_view text = input.substr(kHead);
  CheckForeign(text);
  const std::string whole = Decoded(encoding, text, text.size());
  DEMAND(nas::IsUtf8(whole));
  DEMAND(Decoded(encoding, text, step) == whole);
  const std::string guessed = nas::GuessEncoding(text);
  DEMAND(guessed.empty() || nas::IsUtf8(Decoded(guessed, text, step)));
  return kUsed;
}
