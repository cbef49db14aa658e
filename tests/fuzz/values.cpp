// Sizes, times and bounds as anybody may write them: what is read is in order, within its limits,
// and the same in every way of writing it.

#include <algorithm>
#include <cctype>
#include <cstdlib>

#include "nas/match/query.h"
#include "nas/match/query_values.h"
#include "tests/fuzz/fuzz.h"

namespace {

using nas::Bounds;
using nas::WrittenValue;

constexpr std::time_t kNow = 1'784'548'800;

std::string With(std::string text, char from, char to) {
  std::ranges::replace(text, from, to);
  return text;
}

std::string Upper(std::string text) {
  for (char& c : text) c = c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c;
  return text;
}

bool Same(const std::optional<WrittenValue>& a, const std::optional<WrittenValue>& b) {
  return a.has_value() == b.has_value() && (!a || (a->span == b->span && a->alone == b->alone));
}

void CheckValue(const nas::ValueReader& reader, const std::string& text, bool of_words) {
  const auto value = reader(text);
  DEMAND(Same(value, reader(Upper(text))));
  if (of_words) DEMAND(Same(value, reader(With(text, ' ', '-'))));
  const auto alone = nas::ReadBounds(text, reader);
  if (alone) DEMAND(alone->from <= alone->to);
  if (!value) return;
  DEMAND(value->span.from <= value->span.to && value->alone.from <= value->alone.to);
  const auto least = nas::ReadBounds(">=" + text, reader);
  const auto most = nas::ReadBounds("<=" + text, reader);
  DEMAND(least && most && least->from == value->span.from && most->to == value->span.to);
  // What is behind a value, in it and before it is everything, each once.
  const auto behind = nas::ReadBounds(">" + text, reader);
  DEMAND(!behind || behind->from == value->span.to + 1);
  const auto before = nas::ReadBounds("<" + text, reader);
  DEMAND(!before || before->to == value->span.from - 1);
}

}  // namespace

int fuzz::Target(std::string_view input) {
  const std::string text(input);
  static const bool zone = setenv("TZ", "Europe/Berlin", 1) == 0;
  if (!zone || text.size() > 256) return kUseless;
  const auto time = [](std::string_view written) { return nas::ReadTime(written, kNow); };
  CheckValue(nas::ReadSize, text, false);
  CheckValue(time, text, true);
  CheckValue(nas::ReadNumber, text, false);
  if (text.find_first_of("\"|") != std::string::npos) return kUsed;
  for (const char* prefix : {"size:", "modified:", "depth:", "type:", "ext:", "empty:"}) {
    const auto query = nas::Query::Parse(prefix + ("\"" + text + "\""), kNow);
    DEMAND(query || !query.error().path.empty());
    if (!query) continue;
    const auto first = nas::Query::Parse("<" + (prefix + ("\"" + text + "\"")) + ">", kNow);
    DEMAND(first && first->root().children.size() == query->root().children.size());
  }
  return kUsed;
}
