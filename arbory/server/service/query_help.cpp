#include "arbory/server/service/query_help.h"

#include <string_view>

#include "nas/base/utf8.h"
#include "nas/match/query_spans.h"

namespace arbory {
namespace {

using nas::QueryCompletion;
using nas::QuerySpan;
using nas::QueryWord;

// Of one text from its beginning to its end.
class Places {
 public:
  explicit Places(std::string_view text) : text_(text) {}

  // The units before that byte. Bytes must not go down from one question to the next.
  Json::UInt64 UnitsBefore(size_t byte) {
    while (byte_ < byte && byte_ < text_.size()) Step();
    return units_;
  }
  // The byte behind so many units, of a character as a whole.
  size_t ByteBehind(Json::UInt64 units) {
    while (units_ < units && byte_ < text_.size()) Step();
    return byte_;
  }

 private:
  void Step() {
    constexpr size_t kBytesOfPair = 4;  // characters of so many are two units
    const nas::Utf8Step step = nas::NextUtf8(text_.substr(byte_));
    units_ += step.valid && step.length == kBytesOfPair ? 2 : 1;
    byte_ += step.length;
  }

  const std::string_view text_;
  size_t byte_ = 0;
  Json::UInt64 units_ = 0;
};

const char* NameOf(QuerySpan::Kind kind) {
  switch (kind) {
    case QuerySpan::Kind::kText:
      return "text";
    case QuerySpan::Kind::kPhrase:
      return "phrase";
    case QuerySpan::Kind::kRegex:
      return "regex";
    case QuerySpan::Kind::kPrefix:
      return "prefix";
    case QuerySpan::Kind::kOperator:
      return "operator";
    case QuerySpan::Kind::kGroup:
      return "group";
  }
  return "";
}

const char* NameOf(QueryWord::As as) {
  switch (as) {
    case QueryWord::As::kLiteral:
      return "literal";
    case QueryWord::As::kStart:
      return "start";
    case QueryWord::As::kGlob:
      return "glob";
    case QueryWord::As::kRegex:
      return "regex";
  }
  return "";
}

Json::Value WordJson(const QueryWord& word) {
  Json::Value json;
  json["text"] = word.text;
  json["as"] = NameOf(word.as);
  if (word.exact) json["exact"] = true;
  if (word.in_name != word.in_contents) json["in"] = word.in_name ? "name" : "contents";
  return json;
}

Json::Value SpanJson(const QuerySpan& span, Places& places) {
  Json::Value json;
  json["kind"] = NameOf(span.kind);
  json["begin"] = places.UnitsBefore(span.begin);
  if (span.value > span.begin) json["value"] = places.UnitsBefore(span.value);
  json["end"] = places.UnitsBefore(span.end);
  if (span.alone) json["alone"] = true;
  if (span.open) json["open"] = true;
  if (!span.prefix.empty()) json["prefix"] = span.prefix;
  for (const std::string& value : span.values) json["values"].append(value);
  if (!span.says.empty()) json["says"] = span.says;
  if (!span.wrong.empty()) json["wrong"] = span.wrong;
  for (const QueryWord& word : span.words) json["words"].append(WordJson(word));
  return json;
}

const char* NameOf(QueryCompletion::Of of) {
  switch (of) {
    case QueryCompletion::Of::kNothing:
      break;
    case QueryCompletion::Of::kPrefix:
      return "prefix";
    case QueryCompletion::Of::kValue:
      return "value";
    case QueryCompletion::Of::kShare:
      return "share";
  }
  return "";
}

}  // namespace

Json::Value SpansJson(const std::string& query, std::time_t now) {
  Json::Value all(Json::arrayValue);
  Places places(query);
  for (const QuerySpan& span : nas::SpansOf(query, now)) all.append(SpanJson(span, places));
  return all;
}

Json::Value CompletionJson(const std::string& query, Json::UInt64 place, std::time_t now) {
  const QueryCompletion found = nas::CompletionAt(query, Places(query).ByteBehind(place), now);
  if (found.of == QueryCompletion::Of::kNothing) return {};
  Places places(query);
  Json::Value json;
  json["of"] = NameOf(found.of);
  json["begin"] = places.UnitsBefore(found.begin);
  json["end"] = places.UnitsBefore(found.end);
  json["items"] = Json::Value(Json::arrayValue);
  for (const QueryCompletion::Item& item : found.items) {
    Json::Value& told = json["items"].append(Json::Value());
    told["text"] = item.text;
    told["about"] = item.about;
  }
  return json;
}

}  // namespace arbory
