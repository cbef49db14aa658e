#pragma once
// Which of two results somebody who is still typing most likely means.

#include <compare>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/query.h"

namespace nas {

// The lesser the better.
struct InstantRank {
  bool begins_otherwise = true;  // the name does not begin with a word that was asked for
  bool within_word = true;       // no such word stands by itself in it
  int depth = 0;                 // below the folder that is searched
  std::int64_t age = 0;          // the newer the less
  auto operator<=>(const InstantRank&) const = default;
};

class InstantRanking {
 public:
  explicit InstantRanking(const QueryNode& query);
  // `folded`: the name as it is compared (folded_name.h).
  InstantRank Rank(std::string_view folded, int depth, std::int64_t mtime) const;
  bool Begins(std::string_view folded) const;
  // What names may begin with, folded.
  const std::vector<std::string>& words() const { return words_; }

 private:
  void AddWords(const QueryNode& node);

  std::vector<std::string> words_;  // folded
};

}  // namespace nas
