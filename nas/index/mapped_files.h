#pragma once
// Files that change without an event: a process that has one mapped shared may write to its memory,
// which sets its time of change, and nobody is told before the file is closed.

#include "nas/index/changes.h"

namespace nas {

// Adds the inodes, of whatever file system, that processes have mapped shared. Also where they may
// only read just now: they may have written before. False where that cannot be told of some
// process.
bool AddMappedInodes(Changes& changes);

}  // namespace nas
