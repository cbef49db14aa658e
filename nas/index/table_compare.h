#pragma once
// Whether a table, with what is noted of changes since, is what a walk would find.

#include <atomic>
#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/index/changes.h"
#include "nas/index/name_table.h"
#include "nas/index/tree_scan.h"

namespace nas {

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
