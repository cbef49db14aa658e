// What is made of names and of parts of addresses before they are compared, shown or sent.

#include <sys/types.h>

#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "nas/match/folded_name.h"
#include "nas/results/ordering.h"
#include "nas/system/share_names.h"
#include "platform/system.h"
#include "tests/fuzz/fuzz.h"

namespace {

// As a client is sent it.
std::string Clean(std::string_view text) {
  const Json::Value value(text.data(), text.data() + text.size());
  Json::Value sent;
  DEMAND(nas::ParseJson(nas::JsonText(value, nas::JsonBytes::kClean), &sent));
  return sent.asString();
}

void CheckFolding(std::string_view text) {
  const std::string clean = Clean(text);
  DEMAND(fuzz::IsValidUtf8(clean) && Clean(clean) == clean);
  const bool was_valid = fuzz::IsValidUtf8(text);
  DEMAND((clean == text) == was_valid);
  // A NUL cannot be in a name.
  if (text.find('\0') != std::string_view::npos) return;
  bool valid = false;
  const std::string folded = nas::FoldText(text, &valid);
  DEMAND(valid == was_valid);
  DEMAND(!valid || fuzz::IsValidUtf8(folded));
  nas::FoldedName name;
  name.Set(text);
  DEMAND(name.folded() == folded && name.valid_utf8() == valid);
  DEMAND(name.ascii() == nas::IsAscii(text));
  const std::string composed = nas::ComposeText(text);
  DEMAND(nas::ComposeText(composed) == composed);
  // Composing is part of folding.
  if (valid) DEMAND(nas::FoldText(composed) == folded);
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
  for (const bool inline_shown : {false, true}) {
    const std::string field = arbory::ContentDisposition(inline_shown, text);
    size_t quotes = 0;
    for (const char byte : field) {
      DEMAND(byte >= ' ' && byte <= '~');
      quotes += byte == '"';
    }
    DEMAND(quotes == 2);
  }
}

// What a shell makes of a word in single quotes, with \' between such words.
std::string Unquoted(std::string_view word) {
  std::string text;
  bool quoted = false;
  for (size_t i = 0; i < word.size(); ++i) {
    if (word[i] == '\'') {
      quoted = !quoted;
    } else if (!quoted && word[i] == '\\') {
      DEMAND(++i < word.size());
      text += word[i];
    } else {
      const bool plain = isalnum(static_cast<unsigned char>(word[i])) != 0 ||
                         std::string_view("_-./@%+=:,").find(word[i]) != std::string_view::npos;
      DEMAND(quoted || plain);
      text += word[i];
    }
  }
  DEMAND(!quoted);
  return text;
}

void CheckShellWord(const std::string& text) {
  if (text.find('\0') != std::string::npos) return;
  for (const size_t room : {size_t{0}, text.size() + 1, text.size() + 3, 5 * text.size() + 3}) {
    std::string buffer(room, 'x');
    if (NLIBCEncShParam(text.c_str(), buffer.data(), room) != 0) {
      DEMAND(room < 5 * text.size() + 3);
      continue;
    }
    const size_t end = buffer.find('\0');
    DEMAND(end != std::string::npos && Unquoted(buffer.substr(0, end)) == text);
  }
}

void CheckShareName(const std::string& text) {
  if (!nas::TroubleWithShareName(text).empty()) return;
  DEMAND(!text.empty() && text.size() <= 255 && text != "." && text != ".." && text != "home");
  DEMAND(text.find_first_of(std::string_view("/,\0\n\r\x1b", 6)) == std::string::npos);
}

void CheckOrder(const std::string& text) {
  if (text.find('\0') != std::string::npos) return;
  nas::TextKeys keys;
  const size_t half = text.size() / 2;
  for (const std::string& key : {text.substr(half), text, text.substr(0, half), text}) {
    keys.AddNatural(key);
  }
  DEMAND(keys[1] == keys[3]);
  for (size_t row = 0; row < keys.size(); ++row) {
    DEMAND(keys[row].find('\0') == std::string_view::npos);
  }
  const nas::Ordering order = keys.Order();
  DEMAND(order.size() == keys.size());
  for (size_t i = 1; i < order.size(); ++i) {
    const bool equal = keys[order[i - 1]] == keys[order[i]];
    DEMAND(keys[order[i - 1]] < keys[order[i]] || (equal && order[i - 1] < order[i]));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string text(fuzz::Text(data, size));
  CheckFolding(text);
  CheckAddress(text);
  CheckShellWord(text);
  CheckShareName(text);
  CheckOrder(text);
  return fuzz::kUsed;
}
