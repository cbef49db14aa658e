#pragma once
// An expression that is run over very many texts at once instead of one after the other: a search
// over all of them takes a fraction of the time of as many calls.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace nas {

// The expression (regex.h, of names, letter case ignored) for texts that lie end to end, each with
// a NUL behind it, so that a match lies within one of them and each is as if it were alone. Nothing
// where that is not easily told: whatever looks around or behind, gives up ways to match, refers to
// what was found, sets options, or is not ASCII.
std::optional<std::string> ForManyTexts(std::string_view expression);

// Does not change once made: any thread may ask.
class RegexScan {
 public:
  enum class Texts {
    kBytes,  // what is not ASCII in them is taken as bytes
    kUtf8,   // surely, and in NFC: an expression finds what it finds in each by itself (regex.h)
  };
  // Of an expression of names. Null where there is none of it.
  static std::shared_ptr<const RegexScan> Make(std::string_view expression, Texts texts);
  // Of wildcards (wildcards.h), over the texts of a name table.
  static std::shared_ptr<const RegexScan> OfWildcards(std::string_view expression);
  ~RegexScan();
  RegexScan(const RegexScan&) = delete;
  RegexScan& operator=(const RegexScan&) = delete;

  // Where the first match in `texts` begins that begins at `from` or later; npos where there is
  // none. Nothing where the search was given up.
  std::optional<size_t> Find(std::string_view texts, size_t from) const;

 private:
  explicit RegexScan(void* code) : code_(code) {}
  static std::shared_ptr<const RegexScan> Compile(std::string_view expression,
                                                  std::uint32_t options);
  void* code_;
};

}  // namespace nas
