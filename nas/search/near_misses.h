#pragma once
// What a search that found nothing came close to: what would have been found without one of its
// terms, and the names that are nearest to its words. Looks at every entry once more, with the
// walk's own folders and the judge's own criteria, for a bounded time.

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "nas/search/location.h"
#include "platform/filesearch.h"

namespace nas {

struct NearMisses {
  static constexpr size_t kMostNames = 3;

  struct Term {
    std::string written;             // as in the query; empty for a criterion of its own parameter
    std::uint64_t without = 0;       // entries that fail it and nothing else
    std::vector<std::string> names;  // near to its word, the nearest first
  };
  std::vector<Term> terms;
  std::uint64_t folders = 0;
  std::uint64_t entries = 0;
  std::uint64_t left_out = 0;  // folders that are never searched: file systems of the system's own
  bool complete = false;       // false: the time was over before everything had been looked at
};

// Locations and comparators are borrowed. Reads no contents. The process must have the user's
// identity, and no other thread that forks meanwhile. Throws as SearchJob::Run does.
NearMisses LookForNearMisses(const std::vector<Location>& locations,
                             const std::vector<FileSearch::FindComp*>& comps, bool recursive,
                             std::chrono::milliseconds most);

}  // namespace nas
