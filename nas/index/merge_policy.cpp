#include "nas/index/merge_policy.h"

#include <algorithm>

namespace nas {
namespace {

// What a whole folder costs a search, in names.
constexpr size_t kNamesPerFolder = 16;
// Below this, some 20 ms of a search; of a large table, where everything takes longer, a share.
constexpr size_t kFewNames = 10'000;
constexpr size_t kShareOfEntries = 50;
// Beside so many times what a making takes, it is not noticed.
constexpr int kPaceOfMany = 20;
constexpr int kPaceOfTrees = 100;
constexpr std::chrono::seconds kSoonest{2};
constexpr std::chrono::seconds kSoonestOfTrees{5};

}  // namespace

void MergePolicy::Made(Clock::time_point now, Clock::duration took) {
  made_ = now;
  took_ = took;
}

std::optional<MergePolicy::Clock::time_point> MergePolicy::Due(const Hints& hints,
                                                               const NameTable& table,
                                                               std::chrono::minutes at_most) const {
  const Changes& changes = hints.changes();
  if (changes.size() == 0) return std::nullopt;
  const size_t cost = changes.size() + changes.whole_folders() * kNamesPerFolder;
  Clock::time_point due = made_ + at_most;
  if (cost > std::max(kFewNames, table.entries() / kShareOfEntries)) {
    due = std::min(due, made_ + std::max<Clock::duration>(kSoonest, took_ * kPaceOfMany));
  }
  if (hints.tree_came()) {
    due = std::min(due, made_ + std::max<Clock::duration>(kSoonestOfTrees, took_ * kPaceOfTrees));
  }
  return due;
}

}  // namespace nas
