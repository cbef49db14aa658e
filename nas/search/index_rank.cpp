#include "nas/search/index_rank.h"

#include <dirent.h>

#include <algorithm>
#include <climits>
#include <ctime>
#include <iterator>
#include <thread>

#include "nas/search/spans.h"

namespace nas {
namespace {

using FolderId = NameTable::FolderId;
using EntryId = NameTable::EntryId;

// Of those in order, so many are given: what is closed to the user among them has successors, and
// further matches are counted no further.
constexpr size_t kMostRanked = 4000;
// Where more than one of so many names matches, those that begin with a word are looked for first.
constexpr size_t kNamesForBeginnings = 16;
// Each is one more look at all names.
constexpr size_t kMostWords = 4;

// Looked at in the table's order to learn how many match: where fewer than so many of them do, all
// names are looked at in the order in which they lie.
constexpr size_t kNamesToLearn = 1024;
constexpr size_t kMatchesToGoOn = 6;
// All of so many are looked at as quickly as some of very many.
constexpr EntryId kFewNames = 64 << 10;
// A path costs as much as so many names.
constexpr size_t kNamesForPath = 8;
// Of a location that holds less than one of so many entries, the order has too few.
constexpr EntryId kPartForOrder = 8;

// No worse than any that is such a one.
constexpr Ranked BestOf(bool begins_otherwise, bool within_word) {
  return {{begins_otherwise, within_word, INT_MIN, INT64_MIN}, INT64_MIN};
}
constexpr Ranked kBest = BestOf(false, false);
constexpr Ranked kBestBeginning = BestOf(false, true);
constexpr Ranked kBestOtherwise = BestOf(true, false);
constexpr Ranked kBestWithin = BestOf(true, true);
constexpr Ranked kBehindAll = {{true, true, INT_MAX, INT64_MAX}, INT64_MAX};

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

std::int64_t AgeOf(const NameTable& table, EntryId entry) {
  return table.class_row(entry) < kTypeClasses ? 0 : -table.mtime(entry);
}

std::string_view FoldedNameOf(const NameTable& table, EntryId entry) {
  std::string_view text = table.texts(entry, entry + 1);
  text.remove_suffix(1);
  return text.substr(0, text.find('\1'));
}

// The folder that the entry lies in: `from` or a later one.
FolderId FolderFrom(const NameTable& table, FolderId from, EntryId entry) {
  const auto begin_of = [&table](FolderId folder) { return table.entries_begin(folder); };
  return SpanFrom(begin_of, from, table.folders(), entry);
}

}  // namespace

IndexRank::IndexRank(IndexNames& names, const Settings& settings,
                     const std::vector<IndexNames::NotedName>& noted)
    : names_(names),
      table_(settings.snapshot.table),
      location_(settings.location),
      query_(settings.query),
      by_paths_(names.filter().asks_paths()),
      ranking_(settings.query),
      top_(names.top()),
      begin_(table_.entries_begin(top_)),
      end_(table_.entries_begin(names.end())),
      most_(settings.most),
      most_in_order_(settings.in_order),
      filter_(names.filter(), location_),
      paths_(table_, top_, location_.path),
      behind_(kBest) {
  filter_.Enter({});
  RankNoted(noted);
}

bool IndexRank::more() const {
  return late_ || no_room_ || step_ != Step::kEnd || next_ready_ < ready_.size();
}

std::vector<Ranked> IndexRank::Next(size_t most) {
  most = std::min(most, kMostRanked - given_);
  while (ready_.size() - next_ready_ < most && step_ != Step::kEnd) {
    Advance(most - (ready_.size() - next_ready_));
  }
  return Take(most);
}

std::vector<Ranked> IndexRank::NextAtHand(size_t most) {
  most = std::min(most, kMostRanked - given_);
  const bool few = end_ - begin_ <= kFewNames;
  const auto at_hand = [&] {
    return step_ == Step::kFirst || step_ == Step::kOrder || (few && step_ != Step::kEnd);
  };
  while (ready_.size() - next_ready_ < most && at_hand()) {
    Advance(most - (ready_.size() - next_ready_));
  }
  return Take(most);
}

std::vector<Ranked> IndexRank::Take(size_t most) {
  const size_t count = std::min(most, ready_.size() - next_ready_);
  const auto begin = ready_.begin() + static_cast<std::ptrdiff_t>(next_ready_);
  next_ready_ += count;
  given_ += count;
  return {begin, begin + static_cast<std::ptrdiff_t>(count)};
}

void IndexRank::Advance(size_t wanted) {
  switch (step_) {
    case Step::kChoose:
      return Choose();
    case Step::kFirst:
    case Step::kOrder:
      return WalkOrder(wanted);
    case Step::kBeginnings:
      RankOnBoth(Only::kBeginnings, kBestOtherwise);
      step_ = Step::kWords;
      break;
    case Step::kWords:
      RankOnBoth(Only::kWords, kBestWithin);
      step_ = Step::kOrder;
      break;
    case Step::kAll:
    case Step::kEnd:
      RankOnBoth(Only::kAny, kBehindAll);
      step_ = Step::kEnd;
  }
  // What was left out is better than all that would follow.
  if (late_ || no_room_) step_ = Step::kEnd;
}

bool IndexRank::WordsTell() const {
  const std::vector<std::string>& words = ranking_.words();
  return words.size() <= kMostWords && std::ranges::none_of(words, &std::string::empty);
}

// Where few names match, all of them are put in order as soon.
void IndexRank::Choose() {
  step_ = Step::kAll;
  const bool much = end_ - begin_ >= table_.entries() / kPartForOrder;
  if (!much || !WordsTell()) return;
  if (ranking_.words().empty()) return EndWalk(Step::kOrder);
  size_t matches = 0;
  size_t first = 0;
  size_t looked_at = 0;
  for (const EntryId entry : table_.nearest_first()) {
    if (entry < begin_ || entry >= end_) continue;
    if (looked_at++ == kNamesToLearn / (by_paths_ ? kNamesForPath : 1)) break;
    if (!MayMatch(entry)) continue;
    const InstantRank rank = ranking_.Rank(FoldedNameOf(table_, entry), 0, 0);
    first += !rank.begins_otherwise && !rank.within_word ? 1 : 0;
    ++matches;
  }
  many_ = matches * kNamesForBeginnings > looked_at;
  step_ = first >= kMatchesToGoOn ? Step::kFirst : AfterFirst();
}

void IndexRank::EndWalk(Step next) {
  next_in_order_ = 0;
  found_in_order_ = 0;
  step_ = next;
}

// Through names of one kind; others were looked for before, or will be.
void IndexRank::WalkOrder(size_t wanted) {
  const std::span<const EntryId> order = table_.nearest_first();
  const size_t cost = by_paths_ ? kNamesForPath : 1;
  const bool first = step_ == Step::kFirst;
  const Ranked& kind = first ? kBest : kBestWithin;
  behind_ = std::max(behind_, kind);
  for (size_t found = 0; found < wanted; ++next_in_order_) {
    if (next_in_order_ == order.size()) {
      behind_ = first ? kBestBeginning : kBehindAll;
      TakeNoted(behind_);
      return EndWalk(first ? AfterFirst() : Step::kEnd);
    }
    const bool few = next_in_order_ == kNamesToLearn / cost && found_in_order_ < kMatchesToGoOn;
    if (few || next_in_order_ >= most_in_order_ / cost) {
      return EndWalk(first ? AfterFirst() : Step::kAll);
    }
    const EntryId entry = order[next_in_order_];
    if (entry < begin_ || entry >= end_) continue;
    Ranked one = {kind.rank, entry};
    one.rank.depth = DepthIn(table_.folder_of(entry));
    one.rank.age = AgeOf(table_, entry);
    if (MayMatch(entry) &&
        ranking_.Rank(FoldedNameOf(table_, entry), one.rank.depth, -one.rank.age) == one.rank) {
      TakeNoted(one);
      ready_.push_back(one);
      ++found;
      ++found_in_order_;
    }
    behind_ = one;
  }
}

bool IndexRank::MayMatch(EntryId entry) {
  if (by_paths_ && !filter_.Enter(paths_.Of(table_.folder_of(entry)))) return false;
  return filter_.MayMatch(entry);
}

// What has just changed is taken to be new.
void IndexRank::RankNoted(const std::vector<IndexNames::NotedName>& noted) {
  FoldedName name;
  for (size_t i = 0; i < noted.size(); ++i) {
    name.Set(*noted[i].name);
    QuerySubject subject;
    subject.name = &name;
    if (!MayMatchSomehow(subject)) continue;
    const InstantRank rank = ranking_.Rank(name.folded(), DepthIn(noted[i].folder), INT64_MAX);
    noted_.push_back({rank, -1 - static_cast<std::int64_t>(i)});
  }
  std::ranges::sort(noted_);
}

// Types are not known: any may be it.
bool IndexRank::MayMatchSomehow(QuerySubject& subject) const {
  for (const unsigned char type : {DT_REG, DT_DIR, DT_UNKNOWN}) {
    subject.is_folder = type == DT_DIR;
    subject.is_file = type == DT_REG;
    if (Ask(query_, subject) != Answer::kNo) return true;
  }
  return false;
}

// Those that are better than `below` are ready now.
void IndexRank::TakeNoted(const Ranked& below) {
  for (; next_noted_ < noted_.size() && noted_[next_noted_] < below; ++next_noted_) {
    ready_.push_back(noted_[next_noted_]);
  }
}

void IndexRank::RankOnBoth(Only only, const Ranked& below) {
  FindDepths();
  names_.StartOver();
  const auto begin = static_cast<std::ptrdiff_t>(ready_.size());
  {
    std::jthread other([&] { RankPieces(only, below); });
    RankPieces(only, below);
  }
  TakeNoted(below);
  std::sort(ready_.begin() + begin, ready_.end());
  if (ready_.size() > kMostRanked) {
    ready_.resize(kMostRanked);
    no_room_ = true;
  }
  behind_ = below;
}

void IndexRank::RankPieces(Only only, const Ranked& below) {
  EntryFilter filter(names_.filter(), location_);
  filter.set_only(only, &ranking_.words());
  const std::chrono::nanoseconds late = ProcessorTime() + most_;
  std::vector<EntryId> entries;
  BestKept best;
  while (!late_ && names_.NextCandidates(filter, &entries) > 0) {
    FolderId folder = entries.empty() ? top_ : table_.folder_of(entries.front());
    for (const EntryId entry : entries) {
      folder = FolderFrom(table_, folder, entry);
      Ranked one = {ranking_.Rank(FoldedNameOf(table_, entry), depths_[folder - top_], 0), entry};
      if (best.LeavesOut(one.rank)) continue;
      one.rank.age = AgeOf(table_, entry);
      if (behind_ < one && one < below) best.Add(one);
    }
    entries.clear();
    if (ProcessorTime() >= late) late_ = true;
  }
  best.Shrink();
  const std::lock_guard lock(mutex_);
  ready_.insert(ready_.end(), best.all().begin(), best.all().end());
  no_room_ = no_room_ || best.full();
}

// A folder has a higher number than the one it lies in.
void IndexRank::FindDepths() {
  if (!depths_.empty()) return;
  depths_.resize(names_.end() - top_, 1);
  for (FolderId folder = top_ + 1; folder < names_.end(); ++folder) {
    depths_[folder - top_] = static_cast<std::uint16_t>(depths_[table_.parent(folder) - top_] + 1);
  }
}

int IndexRank::DepthIn(FolderId folder) const {
  int depth = 1;
  for (; folder != top_; folder = table_.parent(folder)) ++depth;
  return depth;
}

}  // namespace nas
