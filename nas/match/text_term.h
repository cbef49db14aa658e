#pragma once
// One term of a query that is a text: what it looks for, and whether a name or a path has it. Does
// not change once made: any thread may ask, with a FoldedName or EntryPath of its own.

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"
#include "nas/match/entry_path.h"
#include "nas/match/folded_name.h"
#include "nas/match/literal_finder.h"
#include "nas/match/regex.h"
#include "nas/match/wildcards.h"

namespace nas {

class TextTerm {
 public:
  enum class Form {
    kPlain,    // wildcards speak
    kLiteral,  // they do not
    kRegex,    // of names only, whatever it holds
    kWhole,    // wildcards speak, and without one too it is about the whole name; with a "/" before
               // its end about the path from the folder that is searched, as in .gitignore
  };
  // `exact`: letter case and accents count. Fails with kErrorIllegal and a sentence about what is
  // wrong in the place of a path.
  static Result<std::shared_ptr<const TextTerm>> Make(std::string_view text, Form form, bool exact);

  bool FindsInName(FoldedName& name) const;
  // For terms that are about paths: those that hold a "/".
  bool FindsInPath(EntryPath& path) const;
  // Of kWhole: whether something on the way to what lies in this folder has the term.
  bool FindsOnWay(const EntryPath& folder) const;
  // Whether FindsInPath may say yes of something in a folder, whose path is given as that of an
  // entry in it without a name. Never no where it may.
  bool MayFindBelow(EntryPath& folder) const;

  // Texts, one of which is in the folded form (folded_name.h) of every name that has the term, or
  // in that form without accents. None where that cannot be told, as of terms about paths.
  std::vector<std::string> RequiredTexts() const;

  // Of wildcards over names, letter case ignored: what finds all names that have the term in the
  // texts of a name table (regex_scan.h). Empty of others, and where all names have it.
  std::string ScanExpression() const;

  const std::string& text() const { return text_; }  // without quotes, prefix and escapes
  // What Make was given.
  const std::string& given() const { return given_; }
  Form form() const { return form_; }
  bool of_path() const { return of_path_; }
  bool exact() const { return exact_; }
  bool is_regex() const { return regex_ != nullptr; }
  // Plain text, looked for anywhere; braces without a wildcard are that too.
  bool is_literal() const { return !is_regex() && literal_; }
  bool has_wildcards() const { return forms_.front().wildcards.has_value(); }

 private:
  // What is compared: the text, and its wildcards where it has any.
  struct Comparand {
    std::string text;
    std::optional<Wildcards> wildcards;
  };

  TextTerm() = default;
  bool AddForm(std::string text);
  bool Fits(std::string_view text, const Comparand& form) const;
  bool MayHold(std::string_view name) const;
  bool ReachesInto(FoldedName& folder) const;
  bool FindsIn(FoldedName& text) const;
  // Of a path term that begins at the root.
  bool Begins(FoldedName& path, std::string_view root) const;
  // Whether what lies in a folder may pass, by its path in one of the forms.
  bool MayFitBelow(std::string_view folder) const;
  template <class Test>
  bool AnyForm(FoldedName& text, const Test& test) const;

  std::string text_;
  std::string given_;
  Form form_ = Form::kPlain;
  bool of_path_ = false;
  bool exact_ = false;
  bool literal_ = false;
  bool plain_ = false;            // holds no accent, so those of names do not count
  std::vector<Comparand> forms_;  // as names are compared; then as bytes, where that differs
  std::shared_ptr<const Regex> regex_;
  // ASCII text without which nothing matches: lets most names be told from their bytes.
  std::optional<LiteralFinder> required_;
  // The same of the path of the folder that a match lies in.
  std::optional<LiteralFinder> required_of_folder_;
};

}  // namespace nas
