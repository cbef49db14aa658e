#pragma once
// What has changed of a file system while nobody looked.

#include <atomic>
#include <functional>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/index/changes.h"
#include "nas/index/name_table.h"
#include "nas/index/tree_scan.h"

namespace nas {

// The folders of the table whose entries may be others than it says: those that have changed since
// their stamp, or have none, ascending. Of one that is not there any more, or is another, the
// folder it was in. Folders below a folder that is not there are not told. Attributes of files
// change without a trace in their folder, so it says nothing of these. The roots are the table's,
// in its order; of `options`, before_reading is called for each folder that is there.
Result<std::vector<NameTable::FolderId>> SweepFolders(const NameTable& table,
                                                      const std::vector<TableRoot>& roots,
                                                      const ScanOptions& options = {});

// How a table differs from the file system.
struct TableDifference {
  enum class Kind {
    kMissing,     // in the file system, not in the table
    kGone,        // in the table, not in the file system
    kType,        // of another type
    kAttributes,  // other size, time, mode, owner, or inode
    kFolder,      // the table's folder is another one, or lacks what is in it
    kOrder,       // the table's own numbers contradict each other
  };
  Kind kind;
  size_t tree;
  std::string path;  // below the tree's root; empty for the root itself
};

// Walks the roots and tells every difference between what is there and what a search believes:
// nothing is told of what `changes` cover. Attributes are compared where `attributes` says that
// they are believed. While the file system changes, differences are told that events are about to
// cover: whoever asks applies these and asks again.
Status CompareTable(const NameTable& table, const Changes& changes, bool attributes,
                    const std::vector<TableRoot>& roots,
                    const std::function<void(const TableDifference&)>& told,
                    const std::atomic<bool>* stop = nullptr);

}  // namespace nas
