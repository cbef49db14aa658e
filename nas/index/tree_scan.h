#pragma once
// Makes name tables from what is in the file system: ScanTree from nothing, MergeTable from an
// older table and what has changed since.
//
// Symbolic links are entries, never followed. A folder that lies on another file system or mount
// is an entry without a folder, and so is the topmost folder of another tree of the table. What
// changes while it is read is told by events: these are to be asked for before the table is made,
// and believed after it.
//
// Reads on threads of its own; memory is about 130 bytes an entry. For a process of its own, at
// best.

#include <atomic>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/index/changes.h"
#include "nas/index/name_table.h"

namespace nas {

struct TableRoot {
  int fd = -1;       // the folder, opened; O_PATH will do. Borrowed
  std::string name;  // what the caller calls the tree
};

// May lie in memory that is shared with another process.
struct ScanProgress {
  std::atomic<std::uint64_t> folders = 0;  // read
  std::atomic<std::uint64_t> entries = 0;
};

struct ScanOptions {
  unsigned threads = 2;
  // Called for each folder before it is looked at, by any of the threads, with the folder opened
  // (O_PATH where it cannot be read) and its key.
  std::function<void(int fd, const FolderKey& key)> before_reading;
  ScanProgress* progress = nullptr;
  const std::atomic<bool>* stop = nullptr;  // ECANCELED soon after it is set
};

// Where the table goes: NameTable::Open with the same three reads it.
struct TablePlace {
  int dir_fd = -1;
  std::string name;
  std::string file_system;
};

// Fails where a root cannot be looked at, the table cannot be written, or on `stop`; a table that
// stood there stays.
Status ScanTree(const std::vector<TableRoot>& roots, const TablePlace& place,
                const ScanOptions& options = {});

// Puts a table in the place that is `old` with all that `changes` tell looked up anew; trees that
// are not in `old` are read whole, and all of it with `all_attributes`. The roots may be others
// than those of `old`; one is known again by its key.
Status MergeTable(const NameTable& old, const Changes& changes, bool all_attributes,
                  const std::vector<TableRoot>& roots, const TablePlace& place,
                  const ScanOptions& options = {});

}  // namespace nas
