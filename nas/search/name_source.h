#pragma once
// Where a search's entries come from: a walk over folders, the files whose contents are still to be
// read, or anything else that knows names and can open the folders they are in.

#include <cstddef>

#include "nas/search/judge.h"

namespace nas {

// Lives at least as long as the SearchJob's run that it is given to.
class NameSource {
 public:
  // As many threads feed from one source at most; they are numbered from 0.
  static constexpr size_t kMostThreads = 16;

  virtual ~NameSource() = default;
  // Tells `judge` folders and their entries until there are no more, or the search is stopping,
  // which is asked for every entry. Called once by each thread of the job, at the same time, with a
  // judge and a number of its own; threads may join while others are at work. What it throws ends
  // the search.
  virtual void Feed(size_t thread, Judge& judge) = 0;
  // Makes every Feed that waits for other threads return. Callable from any thread, repeatedly.
  virtual void Abort() {}
};

}  // namespace nas
