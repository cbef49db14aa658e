#include "nas/search/near_misses.h"

#include <algorithm>
#include <atomic>
#include <memory>
#include <mutex>
#include <tuple>

#include "nas/match/near_text.h"
#include "nas/search/content_reading.h"
#include "nas/search/folder_walk.h"
#include "nas/search/search_job.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

class NoRows : public RowSink {
 public:
  void Append(RowBlock& block) override { block.Clear(); }
};

// One word of the query and the names that are nearest to it.
class NearNames {
 public:
  explicit NearNames(std::string_view word) : near_(word) {}

  // `others`: how many other terms the entry fails, which is worse than being less near.
  void See(FoldedName& name, size_t others) {
    const size_t distance = near_.Distance(name.plain());
    if (distance > near_.farthest()) return;
    const std::lock_guard lock(mutex_);
    const std::tuple one(others, distance, name.name().size(), std::string(name.name()));
    const auto at = std::ranges::lower_bound(nearest_, one);
    const bool known = std::ranges::any_of(
        nearest_, [&](const auto& other) { return std::get<3>(other) == std::get<3>(one); });
    if (known || (at == nearest_.end() && nearest_.size() == NearMisses::kMostNames)) return;
    nearest_.insert(at, one);
    if (nearest_.size() > NearMisses::kMostNames) nearest_.pop_back();
  }
  std::vector<std::string> names() const {
    std::vector<std::string> names;
    for (const auto& [others, distance, length, name] : nearest_) names.push_back(name);
    return names;
  }

 private:
  const NearText near_;
  std::mutex mutex_;  // guards nearest_
  std::vector<std::tuple<size_t, size_t, size_t, std::string>> nearest_;
};

bool IsWord(const QueryNode& node) {
  constexpr size_t kShortest = 3;  // everything is near to less
  if (node.kind != Kind::kText || node.text->of_path() || node.text->is_regex()) return false;
  const size_t length = FoldText(node.text->text()).size();
  return !node.text->has_wildcards() && length >= kShortest && length <= NearText::kLongest;
}

// Judges with what is missing counted.
class MissCounter : public MissSink {
 public:
  explicit MissCounter(const QueryNode& root) : root_(root), without_(root.children.size()) {
    for (const QueryNode& child : root.children) {
      const QueryNode* word = &child;
      if (child.kind == Kind::kAny && !child.children.empty()) word = &child.children.front();
      names_.push_back(
          IsWord(*word) ? std::make_unique<NearNames>(WithoutAccents(FoldText(word->text->text())))
                        : nullptr);
    }
  }

  void See(const QuerySubject& subject) override {
    std::vector<size_t> failed;
    for (size_t i = 0; i < root_.children.size(); ++i) {
      if (Ask(root_.children[i], subject) != Answer::kYes) failed.push_back(i);
    }
    if (failed.size() == 1) without_[failed[0]].fetch_add(1, std::memory_order_relaxed);
    for (const size_t i : failed) {
      if (names_[i]) names_[i]->See(*subject.name, failed.size() - 1);
    }
  }

  std::vector<NearMisses::Term> Terms() const {
    std::vector<NearMisses::Term> terms;
    for (size_t i = 0; i < without_.size(); ++i) {
      terms.push_back({root_.children[i].written, without_[i], {}});
      if (names_[i]) terms.back().names = names_[i]->names();
    }
    return terms;
  }

 private:
  const QueryNode& root_;
  std::vector<std::atomic<std::uint64_t>> without_;
  std::vector<std::unique_ptr<NearNames>> names_;
};

}  // namespace

NearMisses LookForNearMisses(const std::vector<Location>& locations,
                             const std::vector<FileSearch::FindComp*>& comps, bool recursive,
                             std::chrono::milliseconds most) {
  using Clock = std::chrono::steady_clock;
  const Clock::time_point end = Clock::now() + most;
  int stop = 0;
  NoRows rows;
  SharedSearch search(comps, rows, stop);
  MissCounter misses(search.criteria.root);
  search.misses = &misses;
  FolderWalk walk(locations, recursive, search);
  ContentReading contents(locations, search);
  SearchJob job(search, {.report =
                             [&](const WalkProgress&) {
                               if (Clock::now() >= end)
                                 __atomic_store_n(&stop, 1, __ATOMIC_RELAXED);
                             },
                         .stuck = {}});
  NearMisses found;
  found.complete = job.Run(walk, contents);
  found.terms = misses.Terms();
  found.folders = search.progress.folders();
  found.entries = search.progress.entries();
  found.left_out = search.progress.left_out();
  return found;
}

}  // namespace nas
