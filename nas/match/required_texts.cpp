#include "nas/match/required_texts.h"

#include <algorithm>
#include <iterator>
#include <tuple>

namespace nas {
namespace {

using Kind = QueryNode::Kind;
using Texts = std::vector<std::string>;

// The better, the more is left out by it: few texts, long ones.
bool IsBetter(const Texts& a, const Texts& b) {
  const auto rank = [](const Texts& texts) {
    return std::ranges::min(texts, {}, &std::string::size).size() * kMostRequiredTexts /
           texts.size();
  };
  return b.empty() || rank(a) > rank(b);
}

Texts OfAny(const QueryNode& node) {
  Texts all;
  for (const QueryNode& child : node.children) {
    Texts texts = RequiredTexts(child);
    if (texts.empty()) return {};
    std::ranges::move(texts, std::back_inserter(all));
  }
  return all;
}

Texts OfAll(const QueryNode& node) {
  Texts best;
  for (const QueryNode& child : node.children) {
    Texts texts = RequiredTexts(child);
    if (!texts.empty() && IsBetter(texts, best)) best = std::move(texts);
  }
  return best;
}

}  // namespace

std::vector<std::string> RequiredTexts(const QueryNode& query) {
  Texts texts;
  switch (query.kind) {
    case Kind::kAll:
      texts = OfAll(query);
      break;
    case Kind::kAny:
      texts = OfAny(query);
      break;
    case Kind::kText:
      texts = query.text->RequiredTexts();
      break;
    case Kind::kExtension:
      texts = query.suffixes;
      break;
    default:
      return {};
  }
  std::ranges::sort(texts);
  texts.erase(std::unique(texts.begin(), texts.end()), texts.end());
  if (texts.size() > kMostRequiredTexts) texts.clear();
  return texts;
}

}  // namespace nas
