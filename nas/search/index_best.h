#pragma once
// The best matches that an index knows below a location, within some milliseconds: for results
// while somebody types. Candidates are put in order by the table alone, and then looked up in that
// order, as in any search, until there are enough of them; nothing of those that are not looked up
// is told, and so not how many they are. Folders that the table does not have are left out.

#include <chrono>
#include <cstdint>

#include "nas/search/index_names.h"

namespace nas {

struct BestCount {
  std::uint64_t further = 0;  // matches looked up behind the best
  bool more = false;          // there was no time for all of them
};

// On a machine that does nothing else it needs a fraction of that.
struct BestBounds {
  // Of each thread's processor time, for candidates to be put in order.
  std::chrono::milliseconds ranking{16};
  // From the beginning: for the best to be looked up, which is worth waiting for; and for others,
  // which are only counted.
  std::chrono::milliseconds best{200};
  std::chrono::milliseconds further{2};
  // Names looked at in the table's order: beyond it, all are as quickly looked at in the order in
  // which they lie.
  size_t in_order = size_t{16} << 10;
};

// The best go to the sink of `search`, in any order. Throws what that throws.
BestCount FindBest(IndexNames& names, const IndexSnapshot& snapshot, const Location& location,
                   SharedSearch& search, size_t most, const BestBounds& bounds = {});

}  // namespace nas
