// Queries against names and paths: the matcher with all its shortcuts must say what the language
// says, and no query may cost more than its length allows.

#include <vector>

#include "nas/base/utf8.h"
#include "nas/match/meant_query.h"
#include "nas/match/query.h"
#include "nas/match/query_match.h"
#include "nas/match/query_spans.h"
#include "tests/fuzz/fuzz.h"

namespace {

using nas::Answer;
using nas::Query;
using nas::QueryNode;

// Bytes that are no UTF-8 are characters of their own.
std::u32string Characters(std::string_view text) {
  std::u32string characters;
  while (!text.empty()) {
    const nas::Utf8Step step = nas::NextUtf8(text);
    const size_t length = step.valid ? step.length : 1;
    char32_t character = step.valid ? 0 : 0x110000;
    for (size_t i = 0; i < length; ++i) {
      const auto byte = static_cast<unsigned char>(text[i]);
      const unsigned payload = i > 0 ? 0x3F : length == 1 ? 0xFF : 0x7F >> length;
      character = step.valid ? (character << 6) | (byte & payload) : character + byte;
    }
    characters.push_back(character);
    text.remove_prefix(length);
  }
  return characters;
}

// One step of a glob: a run, or one character.
struct Step {
  bool run = false;
  bool negated = false;
  std::vector<std::pair<char32_t, char32_t>> ranges;
  bool Takes(char32_t c) const {
    for (const auto& [low, high] : ranges) {
      if (low <= c && c <= high) return !negated;
    }
    return negated;
  }
};

// Reads the set that begins behind the "[" at `at`; false where no "]" closes it.
bool ReadSet(const std::u32string& pattern, size_t* at, Step* step) {
  size_t i = *at + 1;
  if (i < pattern.size() && (pattern[i] == '!' || pattern[i] == '^')) {
    step->negated = true;
    ++i;
  }
  const size_t end = i < pattern.size() ? pattern.find(U']', i + 1) : std::u32string::npos;
  if (end == std::u32string::npos) return false;
  while (i < end) {
    const bool range = i + 2 < end && pattern[i + 1] == '-';
    step->ranges.emplace_back(pattern[i], pattern[i + (range ? 2 : 0)]);
    i += range ? 3 : 1;
  }
  *at = end;
  return true;
}

std::vector<Step> Steps(const std::u32string& pattern) {
  std::vector<Step> steps;
  for (size_t i = 0; i < pattern.size(); ++i) {
    Step step;
    step.run = pattern[i] == '*';
    if (pattern[i] == '?') step.negated = true;
    if (pattern[i] != '[' || !ReadSet(pattern, &i, &step)) {
      if (pattern[i] == '[') step = {};
      if (pattern[i] != '?') step.ranges.emplace_back(pattern[i], pattern[i]);
    }
    steps.push_back(std::move(step));
  }
  return steps;
}

// The plain way: which beginnings of the text each beginning of the pattern matches.
bool MatchesSlowly(std::string_view pattern, std::string_view text) {
  const std::u32string characters = Characters(text);
  std::vector<bool> reached(characters.size() + 1);
  reached[0] = true;
  for (const Step& step : Steps(Characters(pattern))) {
    std::vector<bool> next(reached.size());
    for (size_t i = 0; i < reached.size(); ++i) {
      if (step.run) {
        next[i] = reached[i] || (i > 0 && next[i - 1]);
      } else {
        next[i] = i > 0 && reached[i - 1] && step.Takes(characters[i - 1]);
      }
    }
    reached = next;
  }
  return reached.back();
}

bool FindsSlowly(const nas::TextTerm& term, std::string_view name) {
  bool valid = false;
  const std::string folded = nas::FoldText(name, &valid);
  const auto finds = [&](const std::string& wanted, std::string_view text) {
    return term.has_wildcards() ? MatchesSlowly(wanted, text)
                                : text.find(wanted) != std::string_view::npos;
  };
  const std::string wanted = nas::FoldText(term.text());
  if (finds(wanted, folded)) return true;
  if (!valid) return finds(nas::AsciiLower(term.text()), folded);
  return nas::WithoutAccents(wanted) == wanted && finds(wanted, nas::WithoutAccents(folded));
}

// Nothing where it is left to the expressions' library, or to a table of cases.
bool MatchesByTheLanguage(const QueryNode& node, std::string_view name, bool* known) {
  using Kind = QueryNode::Kind;
  bool all = true;
  bool any = false;
  for (const QueryNode& child : node.children) {
    const bool matches = MatchesByTheLanguage(child, name, known);
    all &= matches;
    any |= matches;
  }
  if (node.kind <= Kind::kNot) {
    return node.kind == Kind::kAll ? all : node.kind == Kind::kAny ? any : !any;
  }
  if (node.kind != Kind::kText || node.text->is_regex() || node.text->exact() ||
      node.text->of_path() || node.text->text().find_first_of("\\{") != std::string::npos) {
    *known = false;
    return false;
  }
  return FindsSlowly(*node.text, name);
}

Answer Matches(const Query& query, const std::string& name) {
  nas::FoldedName folded;
  folded.Set(name);
  nas::EntryPath path;
  path.SetBase({"/share", "/disk", ""});
  path.SetFolder("a/folder");
  path.SetEntry(name, false);
  const nas::QueryAttributes attributes;
  nas::QuerySubject subject;
  subject.name = &folded;
  subject.path = &path;
  const Answer early = Ask(query.root(), subject);
  subject.attributes = &attributes;
  const Answer answer = Ask(query.root(), subject);
  // What was sure stays so.
  DEMAND(early == Answer::kMaybe || early == answer);
  return answer;
}

}  // namespace

// The query, a line's end, the name.
int fuzz::Target(std::string_view rest) {
  constexpr std::time_t kNow = 1'784'548'800;
  const std::string_view text = fuzz::Take(&rest, '\n');
  const std::string name(rest);
  if (name.size() > 255) return fuzz::kUseless;
  size_t behind = 0;
  bool wrong = false;
  for (const nas::QuerySpan& span : nas::SpansOf(text, kNow)) {
    DEMAND(behind <= span.begin && span.begin <= span.value && span.value <= span.end);
    behind = span.end;
    wrong = wrong || !span.wrong.empty();
  }
  DEMAND(behind <= text.size());
  DEMAND(!wrong || !Query::Parse(text, kNow));
  const nas::QueryCompletion next = nas::CompletionAt(text, text.size() / 2, kNow);
  DEMAND(next.begin <= next.end && next.end <= text.size());
  const std::string meant = nas::MeantQuery(text);
  DEMAND(meant.empty() || bool{Query::Parse(meant)});
  const auto query = Query::Parse(text, kNow);
  if (!query) {
    DEMAND(!query.error().path.empty());
    return fuzz::kUsed;
  }
  // The bytes of a broken query may be part of a name's character.
  bool known = nas::IsUtf8(text);
  const bool expected = MatchesByTheLanguage(query->root(), name, &known);
  const Answer found = Matches(*query, name);
  if (known) DEMAND(found == (expected ? Answer::kYes : Answer::kNo));
  DEMAND(query->restricts() || found == Answer::kYes);
  // Another term only restricts, and an alternative only adds; brackets change nothing.
  const bool open = text.find_first_of("\":|!<>") == std::string_view::npos;
  if (!open) return fuzz::kUsed;
  const std::string written(text);
  const auto narrower = Query::Parse(written + " e", kNow);
  DEMAND(narrower && Matches(*narrower, name) <= found);
  const auto wider = Query::Parse("<" + written + " >|e", kNow);
  DEMAND(wider && (!query->restricts() || Matches(*wider, name) >= found));
  const auto other = Query::Parse("!< " + written + " >", kNow);
  DEMAND(other && (!query->restricts() || Matches(*other, name) != found));
  return fuzz::kUsed;
}
