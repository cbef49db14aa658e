#pragma once
// The language of name patterns. Terms separated by spaces must all match; "a|b" is either; "!a" is
// not; double quotes make one literal term of what they hold; "regex:" makes the rest of the
// pattern one regular expression. A term without wildcards matches anywhere in the name; with one
// it is a glob (glob.h) over the whole name. A pattern without terms restricts nothing. Patterns do
// not change once made: any thread may ask, with a FoldedName of its own.

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"
#include "nas/match/folded_name.h"
#include "nas/match/glob.h"
#include "nas/match/literal_finder.h"
#include "nas/match/regex.h"

namespace nas {

class NamePattern {
 public:
  // One alternative of a term.
  struct Alternative {
    bool negated = false;
    std::string text;    // as written, without quotes and prefix
    std::string folded;  // `text` as names are compared
    // At most one of the two; with neither, `text` is literal.
    std::optional<Glob> glob;
    std::shared_ptr<const Regex> regex;
    // ASCII text without which a name cannot match: lets most names be told from their bytes.
    std::optional<LiteralFinder> required;
    bool is_literal() const { return !glob && !regex; }
    bool Matches(FoldedName& name) const { return Finds(name) != negated; }

   private:
    bool Finds(FoldedName& name) const;
  };
  using Term = std::vector<Alternative>;  // either of them

  // kErrorIllegal for a broken regular expression, a NUL or more than 64 KiB, with what is wrong in
  // the place of a path.
  static Result<NamePattern> Parse(std::string_view text);

  bool Matches(FoldedName& name) const;
  // All of them must match.
  const std::vector<Term>& terms() const { return terms_; }

 private:
  std::vector<Term> terms_;
};

}  // namespace nas
