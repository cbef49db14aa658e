#pragma once
// Candidates of a question, the best first (instant_rank.h), by the table alone: nothing of them is
// verified, so nobody may be told of them. They come in pieces, and no further than they are asked
// for. Where most names match, the best are met by going through the table in its own order of what
// is near and new; where few do, all are put in order.

#include <atomic>
#include <chrono>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "nas/search/index_names.h"
#include "nas/search/instant_rank.h"

namespace nas {

struct Ranked {
  InstantRank rank;
  std::int64_t place;  // an entry of the table; -1 and less: one of the noted names
  auto operator<=>(const Ranked&) const = default;
};

// Everything is borrowed. The calls are one thread's.
class IndexRank {
 public:
  struct Settings {
    const IndexSnapshot& snapshot;
    const Location& location;
    const QueryNode& query;
    // Of each thread's processor time, for all names to be put in order.
    std::chrono::milliseconds most;
    size_t in_order;  // names looked at in the table's order
  };
  // `noted`: names that are not, or not surely, in the table.
  IndexRank(IndexNames& names, const Settings& settings,
            const std::vector<IndexNames::NotedName>& noted);

  // The next ones, in order, at most so many; none where there are no more.
  std::vector<Ranked> Next(size_t most);
  // The same, as long as that takes no look at very many names.
  std::vector<Ranked> NextAtHand(size_t most);
  // Whether there may be more than have been given.
  bool more() const;

 private:
  using FolderId = NameTable::FolderId;
  using EntryId = NameTable::EntryId;
  using Only = EntryFilter::Only;

  // What is looked at next. The names of each have a better rank than those of the following.
  enum class Step : std::uint8_t {
    kChoose,
    kFirst,       // names that begin with a word that stands by itself, in the table's own order
    kBeginnings,  // others that begin with one, from all names
    kWords,       // others in which one stands by itself, from all names
    kOrder,       // others, in the table's own order
    kAll,         // whatever is left, from all names
    kEnd,
  };

  void Advance(size_t wanted);
  void Choose();
  bool WordsTell() const;
  Step AfterFirst() const { return many_ ? Step::kBeginnings : Step::kAll; }
  void WalkOrder(size_t wanted);
  void EndWalk(Step next);
  bool MayMatch(EntryId entry);
  bool MayMatchSomehow(QuerySubject& subject) const;
  void RankNoted(const std::vector<IndexNames::NotedName>& noted);
  void TakeNoted(const Ranked& below);
  void RankOnBoth(Only only, const Ranked& below);
  void RankPieces(Only only, const Ranked& below);
  void FindDepths();
  int DepthIn(FolderId folder) const;
  std::vector<Ranked> Take(size_t most);

  IndexNames& names_;
  const NameTable& table_;
  const Location& location_;
  const QueryNode& query_;
  const bool by_paths_;
  const InstantRanking ranking_;
  const FolderId top_;
  const EntryId begin_;
  const EntryId end_;
  const std::chrono::milliseconds most_;
  const size_t most_in_order_;
  EntryFilter filter_;  // of single entries
  FolderPaths paths_;
  std::vector<std::uint16_t> depths_;  // of what lies in each folder, from top_ on; once needed
  Step step_ = Step::kChoose;
  bool many_ = false;  // that match
  size_t next_in_order_ = 0;
  size_t found_in_order_ = 0;
  std::vector<Ranked> noted_;  // in order
  size_t next_noted_ = 0;
  size_t given_ = 0;
  std::atomic<bool> late_ = false;
  std::mutex mutex_;           // guards the rest, while both threads put names in order
  std::vector<Ranked> ready_;  // in order
  size_t next_ready_ = 0;
  Ranked behind_;  // all that is no worse than this is ready, or was
  bool no_room_ = false;
};

}  // namespace nas
