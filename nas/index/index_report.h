#pragma once
// What the daemon tells of itself, as JSON.

#include <string>
#include <vector>

#include "nas/index/index_plan.h"
#include "nas/index/watcher_process.h"

namespace nas {

// {"current": BOOL, "file_systems": [{"state": WORDS, ...}], "left_out": [{"tree", "why"}]}.
// `current`: everything that is planned answers, with attributes. Whoever is not `master` is told
// the states alone: numbers and paths say something of what others keep.
std::string IndexReport(const std::vector<const WatcherProcess*>& watchers,
                        const std::vector<Plan::LeftOut>& left_out, bool planned, bool master);

}  // namespace nas
