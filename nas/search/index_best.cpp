#include "nas/search/index_best.h"

#include <algorithm>
#include <cstdint>
#include <vector>

#include "nas/search/index_rank.h"
#include "nas/search/index_visit.h"

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;

// So many take no time.
constexpr size_t kLooksWhenLate = 16;

class NoRows : public RowSink {
 public:
  void Append(RowBlock& block) override { block.Clear(); }
};

// Looks candidates up, as any search does.
class BestVisit {
 public:
  BestVisit(IndexNames& names, SharedSearch& search,
            const std::vector<IndexNames::NotedName>& noted, Judge& judge)
      : search_(search), noted_(noted), judge_(judge), visit_(names, 0, judge) {}

  // How many of them match; ends early where the search does, or when it is late.
  size_t Count(std::vector<Ranked> ranked, Clock::time_point late) {
    // Neighbours share the way to them.
    std::ranges::sort(ranked, {}, &Ranked::place);
    size_t count = 0;
    auto next = ranked.begin();
    for (; next != ranked.end() && !search_.stopping() && Clock::now() < late; ++next) {
      count += Matches(*next) ? 1 : 0;
    }
    ended_ = ended_ || next != ranked.end();
    return count;
  }
  // Whether one of the counts ended early.
  bool ended() const { return ended_; }

 private:
  bool Matches(const Ranked& one) {
    if (one.place >= 0)
      return visit_.VisitEntry(static_cast<NameTable::EntryId>(one.place), judge_);
    const auto& [folder, name] = noted_[static_cast<size_t>(-1 - one.place)];
    return visit_.VisitName(folder, *name, judge_);
  }

  SharedSearch& search_;
  const std::vector<IndexNames::NotedName>& noted_;
  Judge& judge_;
  IndexVisit visit_;
  bool ended_ = false;
};

}  // namespace

BestCount FindBest(IndexNames& names, const IndexSnapshot& snapshot, const Location& location,
                   SharedSearch& search, size_t most, const BestBounds& bounds) {
  const Clock::time_point begun = Clock::now();
  const auto noted = names.NotedNames();
  IndexRank rank(names, {snapshot, location, search.criteria.root, bounds.ranking, bounds.in_order},
                 noted);
  Judge judge(search);
  BestVisit best(names, search, noted, judge);
  for (size_t found = 0; found < most && !best.ended();) {
    std::vector<Ranked> ranked = rank.Next(most - found);
    if (ranked.empty()) break;
    found += best.Count(std::move(ranked), begun + bounds.best);
  }
  judge.Flush();
  NoRows nowhere;
  NodeComp query(search.criteria.root);
  SharedSearch counting({&query}, nowhere, search.stop_flag);
  Judge other_judge(counting);
  BestVisit others(names, search, noted, other_judge);
  size_t further = 0;
  const Clock::time_point end = begun + bounds.further;
  for (size_t more_looks = kLooksWhenLate; !others.ended();) {
    // Late, one match is enough to know that there are others.
    const bool late = Clock::now() >= end;
    if (late && (further > 0 || more_looks-- == 0)) break;
    std::vector<Ranked> ranked = rank.NextAtHand(late ? 1 : most);
    if (ranked.empty()) break;
    further += others.Count(std::move(ranked), late ? Clock::time_point::max() : end);
  }
  return {further, rank.more() || best.ended() || others.ended()};
}

}  // namespace nas
