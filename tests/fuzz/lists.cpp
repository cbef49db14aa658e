// Lists that clients write: the splitting of a parameter, and lists of extensions and kinds.

#include <memory>
#include <vector>

#include "nas/base/json_text.h"
#include "nas/search/criteria.h"
#include "nas/search/walk_entry.h"
#include "platform/webfm.h"
#include "tests/fuzz/fuzz.h"

namespace {

// Splits where no backslash stands before, the plain way.
std::vector<std::string> SplitSlowly(const std::string& text, char separator, bool drop_empty) {
  std::vector<std::string> pieces(1);
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + 1 < text.size() && text[i + 1] == separator) {
      pieces.back() += text[++i];
    } else if (text[i] == separator) {
      pieces.emplace_back();
    } else {
      pieces.back() += text[i];
    }
  }
  if (drop_empty) std::erase(pieces, "");
  return pieces;
}

void CheckExplode(const std::string& text, int version, bool drop_empty) {
  const Json::Value pieces = StringExplodeEx(text, ",", version, drop_empty);
  DEMAND(pieces.isArray());
  for (const Json::Value& piece : pieces) DEMAND(piece.isString());
  DEMAND(StringExplodeEx(pieces, ",", version, drop_empty) == pieces);
  Json::Value array;
  const bool is_array = version >= 2 && nas::ParseJson(text, &array) && array.isArray();
  if (is_array) {
    DEMAND(pieces == StringExplodeEx(array, ",", version, drop_empty));
    return;
  }
  const auto expected =
      text.empty() ? std::vector<std::string>() : SplitSlowly(text, ',', drop_empty);
  DEMAND(pieces.size() == expected.size());
  for (Json::ArrayIndex i = 0; i < pieces.size(); ++i) DEMAND(pieces[i].asString() == expected[i]);
}

bool Matches(const FileSearch::FindComp& comp, nas::FoldedName& name, bool is_dir) {
  FileSearch::WalkEntry entry{};
  entry.name = &name;
  entry.is_dir = is_dir;
  return comp.match(entry);
}

void CheckExtensions(const std::string& list, const std::string& name) {
  nas::FoldedName folded;
  folded.Set(name);
  const std::string_view compared = folded.folded();
  bool any = false;
  bool expected = false;
  std::string rest = list;
  for (char& byte : rest) {
    if (byte == ';' || byte == ' ') byte = ',';
  }
  for (std::string word : SplitSlowly(rest + ",", ',', true)) {
    if (word.starts_with("*.")) word.erase(0, 1);
    if (word.starts_with(".")) word.erase(0, 1);
    if (word.empty()) continue;
    any = true;
    const std::string suffix = "." + nas::FoldText(word);
    expected |= compared.size() > suffix.size() && compared.ends_with(suffix);
  }
  if (rest.find('\\') == std::string::npos) {
    DEMAND(Matches(nas::ExtensionComp(list), folded, false) == (!any || expected));
  }
  const auto kind = nas::KindComp::Parse(list);
  if (!kind) return;
  // A kind is of folders or of files, but for the empty word, which restricts nothing.
  const bool both = Matches(*kind, folded, true) && Matches(*kind, folded, false);
  DEMAND(both == list.empty());
}

}  // namespace

// A list, a line's end, a name.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::string_view rest = fuzz::Text(data, size);
  const std::string list(fuzz::Take(&rest, '\n'));
  for (const int version : {1, 2}) {
    for (const bool drop_empty : {false, true}) CheckExplode(list, version, drop_empty);
  }
  CheckExtensions(list, std::string(rest));
  return fuzz::kUsed;
}
