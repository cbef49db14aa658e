#pragma once
// Shell-style wildcards over a whole text: "*" any run, "?" one character, "[a-z]" and "[!a-z]" one
// character of a set. A "[" that no "]" closes stands for itself. Texts and pattern are expected in
// the form in which they are compared (folded_name.h). Bytes that are not UTF-8 count as one
// character each. Every text is a pattern. Matching takes at most text length x pattern length
// steps, whatever the pattern, and any thread may ask.

#include <bitset>
#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace nas {

class Glob {
 public:
  // Whether `text` holds any wildcard.
  static bool HasWildcard(std::string_view text);

  // Position of the "]" that closes the set which opens at `open`, or npos where none does. A "]"
  // that comes first in the set stands for itself.
  static size_t SetEnd(std::string_view pattern, size_t open);

  explicit Glob(std::string_view pattern);
  bool Matches(std::string_view text) const;
  // The longest plain text between two stars, which every match holds; may be empty.
  std::string_view LongestLiteral() const;
  // The same, where it may lie between wildcards for one character.
  std::string LongestText() const;
  // For a scan over many texts (regex_scan.h): an expression over bytes that finds a place in every
  // text that matches, each with a NUL or "\1" behind it. In others too, where characters are not
  // ASCII. Empty where everything matches, and where it would take longer than asking each text.
  // `alone`: it is not put beside others.
  std::string Expression(bool alone) const;

 private:
  // One character: any, or one of (none of) the ranges.
  struct Unit {
    std::vector<std::pair<char32_t, char32_t>> ranges;
    bool any = false;
    bool negated = false;
    std::bitset<128> ascii = {};  // what is accepted of it
    bool Accepts(char32_t c) const;
    bool accepts_others() const;  // any that is not ASCII
    std::string Expression() const;
  };
  // What stands between two stars: a plain text or, where it holds "?" or sets, units.
  struct Segment {
    std::string literal;
    std::vector<Unit> units;  // empty: the segment is `literal`
    // Position behind the match that begins at `at`, or npos.
    size_t MatchAt(std::string_view text, size_t at) const;
    // Position behind the first match that begins at `from` or later, or npos.
    size_t FindFrom(std::string_view text, size_t from) const;
    bool MatchesEnd(std::string_view text, size_t from) const;
    bool AcceptsAscii(const char* at) const;  // as many bytes as there are units
    bool HasFixedLength() const;              // in bytes, of all that it matches
    std::string Expression() const;
    std::string ExpressionFurtherOn() const;
  };

  static Segment ParseSegment(std::string_view pattern);

  std::vector<Segment> segments_;  // n stars make n + 1 segments, some of them empty
};

}  // namespace nas
