#pragma once
// Finds a word that stands by itself, with no letter or digit before or behind it, in megabytes of
// folded texts.

#include <cstddef>
#include <string>
#include <string_view>

namespace nas {

// Of the text's part of that size at `at`. All that is not ASCII counts as letters.
bool StandsByItself(std::string_view text, size_t at, size_t size);

// Does not change once made: any thread may ask.
class WordFinder {
 public:
  // `word` is not empty.
  explicit WordFinder(std::string_view word) : word_(word) {}
  // The first place of it at `from` or later where it stands by itself; npos where there is none.
  size_t Find(std::string_view in, size_t from) const;

 private:
  std::string word_;
};

}  // namespace nas
