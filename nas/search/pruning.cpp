#include "nas/search/pruning.h"

#include <algorithm>
#include <string>

#include "nas/match/entry_path.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

int DeepestOf(const QueryNode& depth) {
  std::int64_t most = 0;
  for (const Bounds& bounds : depth.bounds) most = std::max(most, bounds.to);
  return static_cast<int>(std::min<std::int64_t>(most, INT_MAX));
}

}  // namespace

Pruning Pruning::Of(const QueryNode& root) {
  Pruning pruning;
  for (const QueryNode& child : root.children) {
    if (child.kind == Kind::kExclude) pruning.excludes.push_back(child.text);
    pruning.ignores |= child.kind == Kind::kIgnored;
    pruning.one_disk |= child.kind == Kind::kOneDisk;
    if (child.kind == Kind::kDepth) pruning.deepest = std::min(pruning.deepest, DeepestOf(child));
  }
  return pruning;
}

Refusal Pruning::MayEnter(std::string_view location, std::string_view parent,
                          std::string_view name) const {
  EntryPath path;
  path.SetBase({{}, {}, std::string(location)});
  path.SetFolder(parent);
  path.SetEntry(name, true);
  if (path.depth() >= deepest) return Refusal::kTooDeep;
  FoldedName folded;
  folded.Set(name);
  const bool excluded = std::ranges::any_of(excludes, [&](const auto& text) {
    return text->of_path() ? text->FindsInPath(path) : text->FindsInName(folded);
  });
  return excluded ? Refusal::kFolderExcluded : Refusal::kNone;
}

}  // namespace nas
