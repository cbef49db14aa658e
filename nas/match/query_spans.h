#pragma once
// What a person is told of a query while they type it: where each of its parts stands, what it asks
// for in a few words, what is wrong with it, and the words that can be marked in what is found.
// Made of the same pieces as the tree, so that nobody else has to know where a term ends. Nothing
// here fails; accounts are looked up. Any thread may call.

#include <ctime>
#include <string>
#include <string_view>
#include <vector>

namespace nas {

// Something that a name or a text which was found holds, as it was written.
struct QueryWord {
  enum class As {
    kLiteral,  // anywhere
    kStart,    // where a name begins
    kGlob,     // as the whole name; without braces and backslashes (glob.h)
    kRegex,
  };
  std::string text;
  As as = As::kLiteral;
  bool exact = false;  // letter case counts
  bool in_name = true;
  bool in_contents = true;
};

struct QuerySpan {
  enum class Kind {
    kText,
    kPhrase,  // in quotes
    kRegex,
    kPrefix,    // a prefix and its value
    kOperator,  // "!" or "|"
    kGroup,     // "<" or ">"
  };
  Kind kind = Kind::kText;
  // Bytes of the query. `value` is where the value begins behind prefixes.
  size_t begin = 0;
  size_t value = 0;
  size_t end = 0;
  bool alone = false;  // has to hold by itself: neither left out, nor beside a "|", nor in a group
  bool open = false;   // whatever were written behind it would be part of it
  std::string prefix = {};               // its name without colon
  std::vector<std::string> values = {};  // without quotes
  std::string says = {};
  std::string wrong = {};  // why it cannot be understood
  std::vector<QueryWord> words = {};
};

// One is neither told of more than this: nobody reads them.
inline constexpr size_t kMostSpans = 1000;

// In their order, none over another; blanks lie in none. None of a query that is refused as a
// whole.
std::vector<QuerySpan> SpansOf(std::string_view query, std::time_t now);

// What can be written at a place.
struct QueryCompletion {
  enum class Of { kNothing, kPrefix, kValue, kShare };
  struct Item {
    std::string text;
    std::string about;
  };
  Of of = Of::kNothing;
  // What an item stands in the place of. `begin` to the place itself has been typed of it.
  size_t begin = 0;
  size_t end = 0;
  std::vector<Item> items = {};
};

// `place` is a number of bytes. Of shares there are no items: the caller knows whose are asked for.
QueryCompletion CompletionAt(std::string_view query, size_t place, std::time_t now);

}  // namespace nas
