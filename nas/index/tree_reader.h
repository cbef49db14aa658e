#pragma once
// Reads trees of folders into nodes on several threads, taking from an older table what is said not
// to have changed.

#include <atomic>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "nas/base/unique_fd.h"
#include "nas/files/directory_reader.h"
#include "nas/index/folder_node.h"
#include "nas/index/folder_queue.h"
#include "nas/index/tree_scan.h"

namespace nas {

// Of an older table: the folders whose entries are to be read again.
struct OldTable {
  const NameTable* table = nullptr;
  std::set<NameTable::FolderId> hinted;

  // The first of `hinted` in [begin, end); kNoFolder where there is none.
  NameTable::FolderId FirstHint(NameTable::FolderId begin, NameTable::FolderId end) const;
};

class TreeReader {
 public:
  // All borrowed. `old` may have no table.
  TreeReader(const std::vector<TableRoot>& roots, const OldTable& old, ClassTable& classes,
             const ScanOptions& options);
  ~TreeReader();

  Status Read();

  // Afterwards. A node for each root.
  const std::vector<FolderNode*>& tops() const { return tops_; }
  // Folders of the old table that were not hinted at and yet do not hold what it says.
  const std::set<NameTable::FolderId>& stale() const { return stale_; }
  size_t folders() const { return folders_; }
  size_t entries() const { return entries_; }
  size_t text_bytes() const { return text_bytes_; }

 private:
  struct RootPlace {
    std::uint64_t inode = 0;
    std::uint64_t device = 0;
    std::uint64_t mount = 0;
  };
  using Queue = FolderQueue<FolderNode*>;
  class Worker;

  Status FindRoots();
  bool stopped() const { return options_.stop != nullptr && options_.stop->load(); }
  bool IsRoot(std::uint64_t inode) const;
  UniqueFd OpenByPath(const FolderNode& node) const;

  const std::vector<TableRoot>& roots_;
  const OldTable& old_;
  ClassTable& classes_;
  const ScanOptions& options_;
  std::vector<RootPlace> places_;
  std::vector<FolderNode*> tops_;
  std::vector<std::unique_ptr<NodeArena>> arenas_;
  std::atomic<std::uint64_t> order_ = 0;
  std::atomic<size_t> folders_ = 0;
  std::atomic<size_t> entries_ = 0;
  std::atomic<size_t> text_bytes_ = 0;

  Queue queue_;

  std::mutex mutex_;  // guards what follows
  std::set<NameTable::FolderId> stale_;
};

}  // namespace nas
