#pragma once
// The searches that a person made on the page, in one list by time, with those they have pinned.
// The module's histories are other clients' too, hold ten of each kind, one for each pattern, and
// know days only as they were when the search ran; so the page keeps a list of its own beside them.
//
// It lies in the user's preference folder as `page_searches.json`, the newest first:
//
//   {"searches":[{"at":SECOND,"search":TEXT[,"name":TEXT]}, ...]}
//
// "search" is what stands in the page's address, which says all that was asked for, relative days
// as such; nobody but the page reads it. What has a name is pinned. A list is replaced at once,
// under a lock on `page_searches.lock`; one that cannot be read counts as empty, and the next
// change begins it anew.

#include "nas/webapi/runner.h"

namespace arbory {

// Forks the child that changes the list as the call's parameters say and replies with it, as the
// JSON of an HTTP answer. One of
//
//   {"add":TEXT}               the newest from now on; one that is there is not doubled
//   {"pin":TEXT,"name":TEXT}   kept until it is removed; without a name it is unpinned
//   {"remove":TEXT}
//   {"clear":true}             all but the pinned
//
// or none, which changes nothing. 400 for texts that are too long and for too many pins, 503 where
// the list cannot be written.
nas::Child StartPastSearches(const nas::ApiCall& call);

}  // namespace arbory
