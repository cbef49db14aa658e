#pragma once
// What a search asks of the contents of files.

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/literal_finder.h"
#include "nas/match/query.h"
#include "nas/match/query_match.h"
#include "nas/match/regex.h"

namespace nas {

// Does not change once made: any thread may ask.
class ContentQuery {
 public:
  // Looks for what "content:" asks for and, with `texts_too`, for the texts that names are asked
  // for: then the same query over contents, in which every term has to be found. The texts are left
  // out where one has a wildcard, which speaks of whole names, or is about letter case, and where
  // the query only says what must not be there. Nothing where no contents are asked for.
  static std::optional<ContentQuery> From(const QueryNode& query, bool texts_too);

  // By whose lines a file that was found is explained: the first that tells any. Behind the one
  // with the texts is the one without, as a file may have them in its name. Empty where no contents
  // are asked for.
  static std::vector<ContentQuery> ForLines(const QueryNode& query);

  // The query, in which leaves know their needles.
  const QueryNode& root() const { return root_; }
  bool texts_too() const { return texts_too_; }
  // What the texts say of a file in which these needles have been found, `all_read` to its end or
  // not; what else the query asks counts as met.
  Answer AskTexts(const std::vector<bool>& found, bool all_read) const;

 private:
  friend class ContentScanner;
  // One text: found where any of its forms is.
  struct Needle {
    bool negated = false;
    std::optional<LiteralFinder> literal;
    std::vector<std::shared_ptr<const Regex>> expressions;
    bool Finds(std::string_view text) const { return Find(text, 0).has_value(); }
    // The first place of it that does not begin before `from`.
    std::optional<TextPlace> Find(std::string_view text, size_t from) const;
  };
  static std::optional<Needle> MakeNeedle(const TextTerm& text);
  bool AddNeedles(QueryNode& node, bool negated);

  QueryNode root_;
  bool texts_too_ = false;
  std::vector<Needle> needles_;
  bool by_lines_ = false;      // an expression must see whole lines
  bool beyond_ascii_ = false;  // bytes beyond ASCII matter, so their encoding does
  size_t overlap_ = 0;         // bytes of the longest literal, so none is cut in two
};

}  // namespace nas
