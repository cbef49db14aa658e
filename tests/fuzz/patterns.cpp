// Name patterns against names: the matcher with all its shortcuts must say what the language says.

#include <vector>

#include "nas/base/utf8.h"
#include "nas/match/name_pattern.h"
#include "tests/fuzz/fuzz.h"

namespace {

using nas::FoldedName;
using nas::NamePattern;

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

bool FindsSlowly(const NamePattern::Alternative& alternative, std::string_view name) {
  bool valid = false;
  const std::string folded = nas::FoldText(name, &valid);
  const auto finds = [&](const std::string& wanted) {
    return alternative.glob ? MatchesSlowly(wanted, folded)
                            : folded.find(wanted) != std::string::npos;
  };
  return finds(nas::FoldText(alternative.text)) ||
         (!valid && finds(nas::AsciiLower(alternative.text)));
}

// Nothing where the language leaves it to the expressions' library.
bool MatchesByTheLanguage(const NamePattern& pattern, std::string_view name, bool* known) {
  bool all = true;
  for (const NamePattern::Term& term : pattern.terms()) {
    bool either = false;
    for (const NamePattern::Alternative& alternative : term) {
      if (alternative.regex) *known = false;
      either |= FindsSlowly(alternative, name) != alternative.negated;
    }
    all &= either;
  }
  return all;
}

bool Matches(const NamePattern& pattern, std::string_view name) {
  FoldedName folded;
  folded.Set(name);
  return pattern.Matches(folded);
}

}  // namespace

// The pattern, a line's end, the name.
int fuzz::Target(std::string_view name) {
  const std::string_view text = fuzz::Take(&name, '\n');
  if (name.size() > 255) return fuzz::kUseless;
  const auto pattern = NamePattern::Parse(text);
  if (!pattern) return fuzz::kUsed;
  // The bytes of a broken pattern may be part of a name's character.
  bool known = fuzz::IsValidUtf8(text);
  const bool expected = MatchesByTheLanguage(*pattern, name, &known);
  const bool found = Matches(*pattern, name);
  if (known) DEMAND(found == expected);
  DEMAND(!pattern->terms().empty() || found);
  // Another term only restricts, and an alternative only adds.
  const bool open = text.find_first_of("\":|!") == std::string_view::npos;
  if (!open) return fuzz::kUsed;
  const auto narrower = NamePattern::Parse(std::string(text) + " e");
  DEMAND(narrower && (found || !Matches(*narrower, name)));
  const auto wider = NamePattern::Parse(std::string(text) + "|e");
  DEMAND(wider && (pattern->terms().size() != 1 || !found || Matches(*wider, name)));
  return fuzz::kUsed;
}
