#pragma once
// A search's task record as the terminal reads it: whether the search has ended and how, and what
// its walk has seen so far.

#include <cstdint>
#include <string>

#include "arbory/caller.h"

namespace arbory {

struct SearchState {
  bool exists = false;
  bool finished = false;
  int progress = 0;     // 1: complete, -1: failed with `error`, 0: running, or ended before its end
  int error = 0;        // web API code
  int pid = 0;          // of the worker, which may have ended
  std::string results;  // path of the result file, empty until there is one
  std::string phase;    // empty until the walk has begun
  std::uint64_t folders = 0;
  std::uint64_t entries = 0;
  std::uint64_t matches = 0;
  std::uint64_t unreadable = 0;  // folders skipped for lack of permission
  std::uint64_t troubled = 0;  // folders skipped for other reasons; those that vanished not counted
};
SearchState ReadSearch(const std::string& user, const std::string& task_id);

// "1 folder", "1,204 folders".
std::string Counted(std::uint64_t number, const char* one, const char* many);
// "Searching 3 s: 1,204 folders, 23,456 entries, 42 found".
std::string ProgressText(const SearchState& state, long seconds);

// Why no search can be started for the caller's user just now; a sentence, or empty when one can.
std::string WhyNoTask(const Caller& caller);

}  // namespace arbory
