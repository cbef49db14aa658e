#pragma once
// Files that change without an event: a process that has one mapped shared may write to its memory,
// which sets its time of change, and nobody is told before the file is closed. A mapping may have
// ended before that; whoever had it has the file open for writing then.

#include <string>

#include "nas/index/changes.h"

namespace nas {

// Adds the inodes, of whatever file system, of which processes have such a mapping, or may have had
// one. False, with some of them, where that cannot be told of some process.
bool AddMappedInodes(Changes& changes);

// The same of one process. True where it has ended.
bool AddInodesMappedBy(const std::string& pid, Changes& changes);

}  // namespace nas
