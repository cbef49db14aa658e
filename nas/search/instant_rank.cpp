#include "nas/search/instant_rank.h"

#include <algorithm>

#include "nas/match/folded_name.h"
#include "nas/match/word_finder.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

bool HoldsWord(std::string_view text, std::string_view word) {
  for (size_t at = text.find(word); at != std::string_view::npos; at = text.find(word, at + 1)) {
    if (StandsByItself(text, at, word.size())) return true;
  }
  return false;
}

}  // namespace

InstantRanking::InstantRanking(const QueryNode& query) { AddWords(query); }

void InstantRanking::AddWords(const QueryNode& node) {
  if (node.kind == Kind::kNot) return;
  for (const QueryNode& child : node.children) AddWords(child);
  const bool word = node.kind == Kind::kText && node.text->is_literal() && !node.text->of_path();
  if (word) words_.push_back(FoldText(node.text->text()));
}

bool InstantRanking::Begins(std::string_view folded) const {
  return std::ranges::any_of(
      words_, [folded](const std::string& word) { return folded.starts_with(word); });
}

InstantRank InstantRanking::Rank(std::string_view folded, int depth, std::int64_t mtime) const {
  InstantRank rank{.depth = depth, .age = -mtime};
  rank.begins_otherwise = !Begins(folded);
  rank.within_word = std::ranges::none_of(
      words_, [folded](const std::string& word) { return HoldsWord(folded, word); });
  return rank;
}

}  // namespace nas
