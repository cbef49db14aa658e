#pragma once
// Makes the tables of one file system and compares them with it, each time in a child (TableJob),
// and owns the table's place on disk: STATE/index/ID/names.

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"
#include "nas/index/changes.h"
#include "nas/index/figures.h"
#include "nas/index/name_table.h"
#include "nas/index/table_job.h"
#include "nas/index/tree_scan.h"
#include "nas/index/trees.h"

namespace nas {

// As tables are made of them and compared with them; the descriptors are lent.
std::vector<TableRoot> RootsOf(const Trees& trees);

class TableMaker {
 public:
  enum class Kind {
    kScan,      // a table from nothing
    kSweep,     // which folders are not as the table says
    kMerge,     // a table from the last one and the changes
    kMergeAll,  // the same, with all attributes read anew
  };

  // `trees` and `figures` must outlive it. Makes the folder, 0700. For one thread. EWOULDBLOCK
  // while another one has the folder, or a child that it has left behind.
  static Result<TableMaker> Make(const FileSystem& file_system, const std::string& folder,
                                 const Trees& trees, Figures& figures);

  // The table on disk, with its sums checked. ESTALE where it is of other trees.
  Result<NameTable> OpenTable() const;
  void RemoveTable() const;

  // Begins, unless working(). `table` may be null for kScan alone.
  Status Start(Kind kind, const NameTable* table, const Changes& changes);
  bool working() const { return job_ != nullptr; }
  int fd() const { return job_->fd(); }
  Kind kind() const { return kind_; }
  // As TableJob has them. After Finish, what was found can be asked for.
  bool Read() { return job_->Read(); }
  void Wait(int timeout_ms) const;
  int Finish();
  void Abandon() { job_.reset(); }
  std::chrono::steady_clock::duration took() const { return took_; }

  // After kSweep.
  const std::vector<NameTable::FolderId>& changed_folders() const { return changed_; }
  // After the others, where single folders are watched: those that were watched for the table, and
  // those that could not be.
  InotifySource::Watches TakeWatches() { return std::move(watches_); }
  const std::vector<FolderKey>& unwatched() const { return unwatched_; }

 private:
  TableMaker(const FileSystem& file_system, UniqueFd folder, const Trees& trees, Figures& figures);
  int Sweep(const NameTable& table, int pipe) const;
  int MakeTable(Kind kind, const NameTable* table, const Changes& changes, int pipe) const;
  void ReadChanged(std::string_view output);
  void ReadWatches(std::string_view output);

  std::string id_;
  UniqueFd folder_;
  const Trees* trees_;
  Figures* figures_;
  Kind kind_ = Kind::kScan;
  std::unique_ptr<TableJob> job_;
  std::chrono::steady_clock::time_point begun_;
  std::chrono::steady_clock::duration took_ = {};
  std::vector<NameTable::FolderId> changed_;
  InotifySource::Watches watches_;
  std::vector<FolderKey> unwatched_;
};

}  // namespace nas
