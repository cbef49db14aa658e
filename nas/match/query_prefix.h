#pragma once
// The prefixes of the query language: their names, and what becomes of their values.

#include <ctime>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "nas/base/error.h"
#include "nas/match/query.h"

namespace nas {

struct QueryPrefix {
  // How its value is written: a text is one; others are lists.
  enum class Value {
    kText,
    kRegex,
    kExact,
    kWords,
    kSize,
    kTime,
    kNumber,
    kNothing,
    kGlobs,   // words in which a comma in braces or behind a backslash parts nothing
    kChoice,  // yes or no
    kLetters,
  };
  std::string_view name;  // with its colon
  QueryNode::Kind kind;
  Value value;
  std::string_view help;   // what would be right
  std::string_view about;  // what it asks for, in a few words
  // Values that can be offered, separated by spaces: all that there are, or good beginnings. Of
  // users and groups there is no list.
  std::string_view values = {};
};

// All of them, in the order in which they are offered.
std::span<const QueryPrefix> QueryPrefixes();

// What "hidden:no" leaves out.
inline constexpr std::string_view kHiddenGlob = ".*";

// The prefix that `text` begins with, or null.
const QueryPrefix* FindPrefix(std::string_view text);
// The place of the comma, or the end, behind a name of a list (QueryPrefix::Value::kGlobs) that
// begins at `at`.
size_t EndOfGlob(std::string_view list, size_t at);
// Whether `value` can be read; for values in which spaces may stand.
bool IsValueOf(const QueryPrefix& prefix, std::string_view value, std::time_t now);
// How texts are compared of which no prefix says it.
enum class Letters {
  kAny,    // letter case does not count
  kSmart,  // it does in a text that has a capital letter
  kExact,
};
std::optional<Letters> ParseLetters(std::string_view value);
// Whether letter case counts in the text, which may be a regular expression.
bool IsExact(Letters letters, std::string_view text, bool is_regex);

// The leaf for a value that is not a text. Fails as Query::Parse does, with a sentence that does
// not name the term yet.
Result<QueryNode> PrefixNode(const QueryPrefix& prefix, std::string_view value, std::time_t now,
                             Letters letters = Letters::kAny);

}  // namespace nas
