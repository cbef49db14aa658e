// What is made of names, of lists and of parts of addresses before they are compared, shown or
// sent.

#include <algorithm>

#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"
#include "nas/match/folded_name.h"
#include "nas/system/share_names.h"
#include "platform/webfm.h"
#include "tests/fuzz/fuzz.h"

namespace {

// As a client is sent it.
std::string Clean(const std::string& text) {
  Json::Value sent;
  DEMAND(nas::ParseJson(nas::JsonText(text, nas::JsonBytes::kClean), &sent));
  return sent.asString();
}

void CheckFolding(const std::string& text) {
  const std::string clean = Clean(text);
  const bool was_valid = nas::IsUtf8(text);
  DEMAND(nas::IsUtf8(clean) && Clean(clean) == clean && (clean == text) == was_valid);
  // A NUL cannot be in a name.
  if (text.find('\0') != std::string::npos) return;
  bool valid = false;
  const std::string folded = nas::FoldText(text, &valid);
  DEMAND(valid == was_valid && (!valid || nas::IsUtf8(folded)));
  nas::FoldedName name;
  name.Set(text);
  DEMAND(name.folded() == folded && name.valid_utf8() == valid);
  DEMAND(name.ascii() == nas::IsAscii(text));
  const std::string composed = nas::ComposeText(text);
  DEMAND(nas::ComposeText(composed) == composed);
  // Composing is part of folding.
  DEMAND(!valid || nas::FoldText(composed) == folded);
}

void CheckAddress(const std::string& text) {
  const std::string encoded = arbory::PercentEncoded(text);
  DEMAND(encoded.find_first_of("&=/?# \r\n") == std::string::npos);
  DEMAND(arbory::QueryValue("a=1&v=" + encoded, "v") == text);
  if (const auto path = arbory::SplitPath(text)) {
    std::string again;
    for (const std::string& segment : *path) {
      DEMAND(!segment.empty() && segment != "." && segment != "..");
      DEMAND(segment.find('/') == std::string::npos);
      again += "/" + arbory::PercentEncoded(segment);
    }
    DEMAND(arbory::SplitPath(again.empty() ? "/" : again) == path);
  }
  const std::string field = arbory::ContentDisposition(/*inline_shown=*/false, text);
  DEMAND(std::ranges::all_of(field, [](char byte) { return byte >= ' ' && byte <= '~'; }));
  DEMAND(std::ranges::count(field, '"') == 2);
}

void CheckShareName(const std::string& text) {
  if (!nas::TroubleWithShareName(text).empty()) return;
  DEMAND(!text.empty() && text.size() <= 255 && text != "." && text != ".." && text != "home");
  DEMAND(text.find_first_of(std::string_view("/,\0\n\r\x1b", 6)) == std::string::npos);
}

// Pieces come back from a text that has them with their separators escaped.
void CheckList(const std::string& text) {
  for (const bool drop_empty : {false, true}) {
    const Json::Value pieces = StringExplodeEx(text, ",", 2, drop_empty);
    DEMAND(pieces.isArray() && StringExplodeEx(pieces, ",", 2, drop_empty) == pieces);
    std::string joined;
    bool ambiguous = false;
    for (const Json::Value& piece : pieces) {
      if (!joined.empty()) joined += ',';
      for (const char byte : piece.asString()) joined += byte == ',' ? "\\," : std::string(1, byte);
      ambiguous |= piece == "" || piece.asString().ends_with('\\');
    }
    DEMAND(ambiguous || StringExplodeEx(joined, ",", 1, drop_empty) == pieces);
  }
}

}  // namespace

int fuzz::Target(std::string_view input) {
  const std::string text(input);
  CheckFolding(text);
  CheckAddress(text);
  CheckShareName(text);
  CheckList(text);
  return fuzz::kUsed;
}
