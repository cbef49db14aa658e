#pragma once
// What a search asks of the contents of files.

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/literal_finder.h"
#include "nas/match/name_pattern.h"
#include "nas/match/regex.h"

namespace nas {

// Does not change once made: any thread may ask.
class ContentQuery {
 public:
  // The same expression over contents: every term must be found, either of its alternatives will
  // do. Nothing where the pattern has a wildcard, which speaks of whole names, or where it only
  // says what must not be there.
  static std::optional<ContentQuery> From(const NamePattern& pattern);

 private:
  friend class ContentScanner;
  // One alternative: found where any of its forms is.
  struct Needle {
    bool negated = false;
    std::optional<LiteralFinder> literal;
    std::vector<std::shared_ptr<const Regex>> expressions;
    bool Finds(std::string_view text) const { return Find(text, 0).has_value(); }
    // The first place of it that does not begin before `from`.
    std::optional<TextPlace> Find(std::string_view text, size_t from) const;
  };
  static std::optional<Needle> MakeNeedle(const NamePattern::Alternative& alternative);

  std::vector<Needle> needles_;
  std::vector<std::vector<size_t>> terms_;  // indexes of needles: all terms, either needle
  bool has_negated_ = false;
  bool by_lines_ = false;      // an expression must see whole lines
  bool beyond_ascii_ = false;  // bytes beyond ASCII matter, so their encoding does
  size_t overlap_ = 0;         // bytes of the longest literal, so none is cut in two
};

}  // namespace nas
