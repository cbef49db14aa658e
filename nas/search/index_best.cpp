#include "nas/search/index_best.h"

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "nas/search/index_visit.h"
#include "nas/search/instant_rank.h"

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;
using FolderId = NameTable::FolderId;
using EntryId = NameTable::EntryId;

// Of those in order, so many are kept: what is closed to the user among them has successors, and
// further matches are counted no further.
constexpr size_t kMostRanked = 4000;

struct Ranked {
  InstantRank rank;
  std::int64_t place;  // an entry of the table; -1 and less: one of the noted names
  auto operator<=>(const Ranked&) const = default;
};

class NoRows : public RowSink {
 public:
  void Append(RowBlock& block) override { block.Clear(); }
};

void KeepBest(std::vector<Ranked>& all) {
  if (all.size() <= kMostRanked) return;
  std::ranges::nth_element(all, all.begin() + kMostRanked);
  all.resize(kMostRanked);
}

class Ranker {
 public:
  Ranker(IndexNames& names, const NameTable& table, const Location& location,
         const QueryNode& query, FolderId top, Clock::time_point end)
      : names_(names),
        table_(table),
        location_(location),
        query_(query),
        ranking_(query),
        top_(top),
        end_(end) {}

  // Whether there was no time for all, or no room.
  bool cut() const { return cut_; }

  // `noted`: names that are not, or not surely, in the table.
  std::vector<Ranked> RankAll(const std::vector<IndexNames::NotedName>& noted) {
    RankNoted(noted);
    {
      std::jthread other([this] { RankPieces(); });
      RankPieces();
    }
    cut_ = cut_ || all_.size() > kMostRanked;
    KeepBest(all_);
    std::ranges::sort(all_);
    return std::move(all_);
  }

 private:
  // What has just changed is taken to be new.
  void RankNoted(const std::vector<IndexNames::NotedName>& noted) {
    FoldedName name;
    for (size_t i = 0; i < noted.size(); ++i) {
      name.Set(*noted[i].name);
      QuerySubject subject;
      subject.name = &name;
      if (!MayMatch(subject)) continue;
      const InstantRank rank = ranking_.Rank(name.folded(), DepthOf(noted[i].folder), INT64_MAX);
      all_.push_back({rank, -1 - static_cast<std::int64_t>(i)});
    }
  }

  // Types are not known: either may be it.
  bool MayMatch(QuerySubject& subject) const {
    for (const bool folder : {false, true}) {
      subject.is_folder = folder;
      subject.is_file = !folder;
      if (Ask(query_, subject) != Answer::kNo) return true;
    }
    return false;
  }

  void RankPieces() {
    EntryFilter filter(names_.filter(), location_);
    std::vector<EntryId> entries;
    std::vector<Ranked> mine;
    size_t begun = 0;  // of mine, those whose names begin with what was asked for
    while (names_.NextCandidates(filter, &entries)) {
      FolderId folder = NameTable::kNoFolder;
      int depth = 0;
      for (const EntryId entry : entries) {
        const std::string_view name = FoldedNameOf(entry);
        const bool begins = ranking_.Begins(name);
        if (!begins && begun >= kMostRanked) {
          cut_ = true;
          continue;
        }
        begun += begins ? 1 : 0;
        if (folder == NameTable::kNoFolder || entry >= table_.entries_end(folder)) {
          folder = table_.folder_of(entry);
          depth = DepthOf(folder);
        }
        const auto attributes = table_.attributes(entry);
        mine.push_back({ranking_.Rank(name, depth, attributes ? attributes->mtime : 0), entry});
      }
      entries.clear();
      if (mine.size() > 2 * kMostRanked) {
        KeepBest(mine);
        cut_ = true;
      }
      if (Clock::now() >= end_) {
        cut_ = true;
        break;
      }
    }
    const std::lock_guard lock(mutex_);
    all_.insert(all_.end(), mine.begin(), mine.end());
  }

  std::string_view FoldedNameOf(EntryId entry) const {
    const std::string_view text = table_.texts(entry, entry + 1);
    return text.substr(0, text.find_first_of({"\1\0", 2}));
  }

  int DepthOf(FolderId folder) const {
    int depth = 1;
    for (; folder != top_; folder = table_.parent(folder)) ++depth;
    return depth;
  }

  IndexNames& names_;
  const NameTable& table_;
  const Location& location_;
  const QueryNode& query_;
  const InstantRanking ranking_;
  const FolderId top_;
  const Clock::time_point end_;
  std::atomic<bool> cut_ = false;
  std::mutex mutex_;  // guards all_
  std::vector<Ranked> all_;
};

}  // namespace

BestCount FindBest(IndexNames& names, const IndexSnapshot& snapshot, const Location& location,
                   SharedSearch& search, size_t most, std::chrono::milliseconds budget) {
  // The best are worth waiting for longer than the count of the others.
  constexpr int kPatience = 5;
  const Clock::time_point begun = Clock::now();
  // Most questions need a fraction of that for all names.
  const Clock::time_point ranked_by = begun + 2 * budget;
  const auto noted = names.NotedNames();
  Ranker ranker(names, snapshot.table, location, search.criteria.root,
                IndexNames::FolderOf(snapshot, location), ranked_by);
  const std::vector<Ranked> ranked = ranker.RankAll(noted);
  NoRows nowhere;
  NodeComp query(search.criteria.root);
  SharedSearch counting({&query}, nowhere, search.stop_flag);
  Judge best(search);
  Judge further(counting);
  IndexVisit visit(names, 0, best);
  BestCount count{.more = ranker.cut()};
  size_t found = 0;
  for (const Ranked& one : ranked) {
    const bool enough = found >= most;
    if (search.stopping() || Clock::now() >= begun + (enough ? 1 : kPatience) * budget) {
      count.more = true;
      break;
    }
    Judge& judge = enough ? further : best;
    bool match = false;
    if (one.place < 0) {
      const auto& [folder, name] = noted[static_cast<size_t>(-1 - one.place)];
      match = visit.VisitName(folder, *name, judge);
    } else {
      match = visit.VisitEntry(static_cast<EntryId>(one.place), judge);
    }
    if (match && enough) ++count.further;
    if (match && !enough) ++found;
  }
  best.Flush();
  return count;
}

}  // namespace nas
