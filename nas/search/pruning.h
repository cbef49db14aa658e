#pragma once
// What the terms of a search say of folders that it meets: which of them it does not enter. Whoever
// goes down a tree asks, so that a walk, an index and an explanation agree.

#include <climits>
#include <memory>
#include <string_view>
#include <vector>

#include "nas/match/query.h"
#include "nas/search/refusal.h"

namespace nas {

struct Pruning {
  static Pruning Of(const QueryNode& root);

  std::vector<std::shared_ptr<const TextTerm>> excludes = {};
  int deepest = INT_MAX;  // of entries that can match; 1 lies directly in the location
  bool ignores = false;   // ignore files are obeyed
  bool one_disk = false;

  bool by_names() const { return !excludes.empty() || deepest < INT_MAX; }
  // Of a folder that is met: `name` in the folder at `parent` below the location's path `location`,
  // both below the share's root. Folders on the way to it have been asked about before.
  Refusal MayEnter(std::string_view location, std::string_view parent, std::string_view name) const;
};

}  // namespace nas
