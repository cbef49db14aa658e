#pragma once
// Regular expressions (PCRE2, compiled to machine code). Case is ignored unless it is asked for,
// texts are UTF-8 and may hold bytes that are not: those match nothing. A search that would take
// exponentially long is given up and counts as not matching.

#include <memory>
#include <optional>
#include <string_view>

#include "nas/base/error.h"
#include "nas/match/text_place.h"

namespace nas {

class Regex {
 public:
  enum class Kind {
    kName,     // the text is one name: "." matches a newline, "$" only the very end
    kContent,  // the text holds lines: "^" and "$" match at each
    kLiteral,  // the pattern is a plain text to be found in content
  };

  // kErrorIllegal for a broken expression, with what is wrong and where in the place of a path.
  static Result<std::shared_ptr<const Regex>> Compile(std::string_view pattern, Kind kind,
                                                      bool exact_case = false);
  ~Regex();
  Regex(const Regex&) = delete;
  Regex& operator=(const Regex&) = delete;

  // Whether the expression matches anywhere in `text`. Any number of threads may ask.
  bool Finds(std::string_view text) const { return Find(text, 0).has_value(); }
  // The first place that does not begin before `from`.
  std::optional<TextPlace> Find(std::string_view text, size_t from) const;

 private:
  Regex(void* code, void* ascii_code) : code_(code), ascii_code_(ascii_code) {}
  void* code_;  // pcre2_code_8, kept out of this header
  // The same expression for texts that are ASCII, where it means the same and need not look out for
  // longer characters; null where there is none.
  void* ascii_code_;
};

}  // namespace nas
