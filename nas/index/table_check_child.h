#pragma once
// The process that compares what a watcher knows with what there is, for `arbory index --check`. It
// keeps the daemon's rights, and tells paths: for root and the daemon's own user.
//
// It says kIndexCurrent, then a frame kRows for each difference, in words, then kEnd with how many
// there are, or an error in words.

#include <sys/types.h>

#include <vector>

#include "nas/index/changes.h"
#include "nas/index/tree_scan.h"

namespace nas {

// Forks it. Its id, for the caller to reap, or -1 with errno set. For a process of one thread.
pid_t StartCheck(int connection, const NameTable& table, const Changes& changes, bool attributes,
                 const std::vector<TableRoot>& roots);

}  // namespace nas
