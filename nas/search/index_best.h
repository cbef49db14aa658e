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

// The best go to the sink of `search`, in order. Throws what that throws.
BestCount FindBest(IndexNames& names, const IndexSnapshot& snapshot, const Location& location,
                   SharedSearch& search, size_t most, std::chrono::milliseconds budget);

}  // namespace nas
