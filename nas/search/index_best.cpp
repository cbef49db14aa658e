#include "nas/search/index_best.h"

#include <dirent.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <ctime>
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
// Where more than one of so many names matches, those that begin with a word are looked for first.
constexpr size_t kNamesForBeginnings = 16;

struct Ranked {
  InstantRank rank;
  std::int64_t place;  // an entry of the table; -1 and less: one of the noted names
  auto operator<=>(const Ranked&) const = default;
};

class NoRows : public RowSink {
 public:
  void Append(RowBlock& block) override { block.Clear(); }
};

// The best of what it is given.
class BestKept {
 public:
  // Whether the rank, whatever the age, is not among them.
  bool LeavesOut(const InstantRank& rank) const {
    InstantRank newest = rank;
    newest.age = INT64_MIN;
    return full_ && worst_ < newest;
  }
  void Add(const Ranked& one) {
    if (full_ && worst_ < one.rank) return;
    all_.push_back(one);
    if (all_.size() == 2 * kMostRanked) Shrink();
  }
  void Shrink() {
    if (all_.size() <= kMostRanked) return;
    std::ranges::nth_element(all_, all_.begin() + (kMostRanked - 1));
    all_.resize(kMostRanked);
    worst_ = all_.back().rank;
    full_ = true;
  }
  // Whether something was left out.
  bool full() const { return full_; }
  const std::vector<Ranked>& all() const { return all_; }

 private:
  std::vector<Ranked> all_;
  bool full_ = false;
  InstantRank worst_;  // of those that were kept, once it is full
};

// Of the calling thread. Where the machine does much else, a little patience gives the same answer.
std::chrono::nanoseconds ProcessorTime() {
  timespec used = {};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &used);
  return std::chrono::seconds(used.tv_sec) + std::chrono::nanoseconds(used.tv_nsec);
}

class Ranker {
 public:
  Ranker(IndexNames& names, const NameTable& table, const Location& location,
         const QueryNode& query, FolderId top, std::chrono::milliseconds most)
      : names_(names),
        table_(table),
        location_(location),
        query_(query),
        ranking_(query),
        top_(top),
        most_(most) {}

  // Whether there was no time for all, or no room.
  bool cut() const { return late_ || no_room_; }

  // `noted`: names that are not, or not surely, in the table.
  std::vector<Ranked> RankAll(const std::vector<IndexNames::NotedName>& noted) {
    FindDepths();
    RankNoted(noted);
    // Where enough names begin with a word, none of the others is better.
    by_beginnings_ = BeginningsTell();
    if (by_beginnings_) {
      RankOnBoth(&ranking_.words());
      names_.StartOver();
    }
    if (all_.size() < kMostRanked) {
      RankOnBoth(nullptr);
    } else {
      no_room_ = true;
    }
    std::ranges::sort(all_);
    no_room_ = no_room_ || all_.size() > kMostRanked;
    all_.resize(std::min(all_.size(), kMostRanked));
    return std::move(all_);
  }

 private:
  // Worth one more look at all names for each word; where few match, all are put in order as soon.
  bool BeginningsTell() {
    constexpr size_t kMostWords = 4;
    const std::vector<std::string>& words = ranking_.words();
    if (words.empty() || words.size() > kMostWords ||
        std::ranges::any_of(words, &std::string::empty)) {
      return false;
    }
    EntryFilter filter(names_.filter(), location_);
    std::vector<EntryId> some;
    const size_t looked_at = names_.NextCandidates(filter, &some);
    names_.StartOver();
    return some.size() * kNamesForBeginnings > looked_at;
  }

  // A folder has a higher number than the one it lies in.
  void FindDepths() {
    const FolderId end = table_.subtree_end(top_);
    depths_.resize(end - top_, 1);
    for (FolderId folder = top_ + 1; folder < end; ++folder) {
      depths_[folder - top_] =
          static_cast<std::uint16_t>(depths_[table_.parent(folder) - top_] + 1);
    }
  }

  // What has just changed is taken to be new.
  void RankNoted(const std::vector<IndexNames::NotedName>& noted) {
    FoldedName name;
    for (size_t i = 0; i < noted.size(); ++i) {
      name.Set(*noted[i].name);
      QuerySubject subject;
      subject.name = &name;
      if (!MayMatch(subject)) continue;
      const int depth = depths_[noted[i].folder - top_];
      const InstantRank rank = ranking_.Rank(name.folded(), depth, INT64_MAX);
      all_.push_back({rank, -1 - static_cast<std::int64_t>(i)});
    }
  }

  // Types are not known: any may be it.
  bool MayMatch(QuerySubject& subject) const {
    for (const unsigned char type : {DT_REG, DT_DIR, DT_UNKNOWN}) {
      subject.is_folder = type == DT_DIR;
      subject.is_file = type == DT_REG;
      if (Ask(query_, subject) != Answer::kNo) return true;
    }
    return false;
  }

  // `beginnings`: those alone that begin so. Null: those alone that were not asked for so.
  void RankOnBoth(const std::vector<std::string>* beginnings) {
    std::jthread other([&] { RankPieces(beginnings); });
    RankPieces(beginnings);
  }

  void RankPieces(const std::vector<std::string>* beginnings) {
    EntryFilter filter(names_.filter(), location_);
    filter.set_beginnings(beginnings);
    const std::chrono::nanoseconds late = ProcessorTime() + most_;
    const bool others_only = by_beginnings_ && beginnings == nullptr;
    std::vector<EntryId> entries;
    BestKept best;
    while (!late_ && names_.NextCandidates(filter, &entries) > 0) {
      FolderId folder = entries.empty() ? top_ : table_.folder_of(entries.front());
      for (const EntryId entry : entries) {
        folder = FolderFrom(folder, entry);
        InstantRank rank = ranking_.Rank(FoldedNameOf(entry), depths_[folder - top_], 0);
        if (others_only && !rank.begins_otherwise) continue;
        if (best.LeavesOut(rank)) continue;
        rank.age = table_.class_row(entry) < kTypeClasses ? 0 : -table_.mtime(entry);
        best.Add({rank, entry});
      }
      entries.clear();
      if (ProcessorTime() >= late) late_ = true;
    }
    best.Shrink();
    const std::lock_guard lock(mutex_);
    all_.insert(all_.end(), best.all().begin(), best.all().end());
    no_room_ = no_room_ || best.full();
  }

  std::string_view FoldedNameOf(EntryId entry) const {
    std::string_view text = table_.texts(entry, entry + 1);
    text.remove_suffix(1);
    return text.substr(0, text.find('\1'));
  }

  // The folder that the entry lies in, which is most often near `from`, or that itself.
  FolderId FolderFrom(FolderId from, EntryId entry) const {
    const FolderId last = table_.folders() - 1;
    FolderId step = 1;
    while (step <= last - from && table_.entries_begin(from + step) <= entry) {
      from += step;
      step *= 2;
    }
    for (; step > 0; step /= 2) {
      if (step <= last - from && table_.entries_begin(from + step) <= entry) from += step;
    }
    return from;
  }

  IndexNames& names_;
  const NameTable& table_;
  const Location& location_;
  const QueryNode& query_;
  const InstantRanking ranking_;
  const FolderId top_;
  const std::chrono::milliseconds most_;  // of each thread
  std::vector<std::uint16_t> depths_;     // of what lies in each folder, from top_ on
  bool by_beginnings_ = false;
  std::atomic<bool> late_ = false;
  std::mutex mutex_;  // guards the rest
  std::vector<Ranked> all_;
  bool no_room_ = false;
};

// Looks candidates up, as any search does.
class BestVisit {
 public:
  BestVisit(IndexNames& names, SharedSearch& search,
            const std::vector<IndexNames::NotedName>& noted, Judge& judge)
      : search_(search), noted_(noted), judge_(judge), visit_(names, 0, judge) {}

  // How many of [begin, end) match; ends early where the search does, or when it is late.
  size_t Count(std::vector<Ranked>::iterator begin, std::vector<Ranked>::iterator end,
               Clock::time_point late) {
    // Neighbours share the way to them.
    std::ranges::sort(begin, end, {}, &Ranked::place);
    size_t count = 0;
    for (; begin != end && !search_.stopping() && Clock::now() < late; ++begin) {
      count += Matches(*begin) ? 1 : 0;
    }
    ended_ = ended_ || begin != end;
    return count;
  }
  // Whether one of the counts ended early.
  bool ended() const { return ended_; }

 private:
  bool Matches(const Ranked& one) {
    if (one.place >= 0) return visit_.VisitEntry(static_cast<EntryId>(one.place), judge_);
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
  Ranker ranker(names, snapshot.table, location, search.criteria.root,
                IndexNames::FolderOf(snapshot, location), bounds.ranking);
  std::vector<Ranked> ranked = ranker.RankAll(noted);
  auto next = ranked.begin();
  Judge judge(search);
  BestVisit best(names, search, noted, judge);
  for (size_t found = 0; found < most && next != ranked.end() && !best.ended();) {
    const auto end =
        next + std::min(static_cast<std::ptrdiff_t>(most - found), ranked.end() - next);
    found += best.Count(next, end, begun + bounds.best);
    next = end;
  }
  judge.Flush();
  NoRows nowhere;
  NodeComp query(search.criteria.root);
  SharedSearch counting({&query}, nowhere, search.stop_flag);
  Judge other_judge(counting);
  BestVisit others(names, search, noted, other_judge);
  const size_t further = others.Count(next, ranked.end(), begun + bounds.further);
  return {further, ranker.cut() || best.ended() || others.ended()};
}

}  // namespace nas
