#include "nas/index/table_sweep.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <mutex>

#include "nas/files/beneath.h"
#include "nas/index/folder_queue.h"
#include "nas/index/folder_reader.h"
#include "nas/index/open_path.h"

namespace nas {
namespace {

using FolderId = NameTable::FolderId;

// A folder is compared by its name in the folder it lies in, and opened only where there are
// folders in it: most have none.
class Sweeper {
 public:
  Sweeper(const NameTable& table, const std::vector<TableRoot>& roots, const ScanOptions& options)
      : table_(table), roots_(roots), options_(options) {}

  Result<std::vector<FolderId>> Sweep();

 private:
  using Queue = FolderQueue<FolderId>;

  // Whether the folder is still the one of the table.
  bool Compare(int parent, const char* name, FolderId id, std::vector<FolderId>& differ);
  void CompareBelow(UniqueFd fd, FolderId id, std::vector<FolderId>& differ);
  // The folder is not where the table has it. It may be anywhere else, changed or not, and be asked
  // about there.
  void Gone(FolderId id, std::vector<FolderId>& differ) const;
  void Open(const Queue::Task& task, std::vector<FolderId>& differ);
  size_t TreeOf(FolderId id) const;
  bool HasFolders(FolderId id) const { return table_.subtree_end(id) > id + 1; }
  bool stopped() const { return options_.stop != nullptr && options_.stop->load(); }

  const NameTable& table_;
  const std::vector<TableRoot>& roots_;
  const ScanOptions& options_;
  Queue queue_;
  std::mutex mutex_;  // guards differ_
  std::vector<FolderId> differ_;
};

size_t Sweeper::TreeOf(FolderId id) const {
  size_t tree = 0;
  while (table_.subtree_end(table_.top(tree)) <= id) ++tree;
  return tree;
}

bool Sweeper::Compare(int parent, const char* name, FolderId id, std::vector<FolderId>& differ) {
  if (options_.progress != nullptr) ++options_.progress->folders;
  UniqueFd fd;
  if (options_.before_reading) {
    constexpr int kFlags = O_DIRECTORY | O_NOFOLLOW;
    fd = OpenOnSameMount(parent, name, O_RDONLY | O_NONBLOCK | kFlags);
    if (!fd) fd = OpenOnSameMount(parent, name, O_PATH | kFlags);
    if (!fd) return false;
    options_.before_reading(fd.get(), KeyOf(fd.get()).value_or({}));
  }
  struct statx status;
  constexpr int kFlags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC;
  if (statx(parent, name, kFlags, STATX_TYPE | STATX_INO | STATX_CTIME, &status) != 0 ||
      !S_ISDIR(status.stx_mode) || status.stx_ino != table_.folder_inode(id)) {
    return false;
  }
  const NameTable::Stamp now = {status.stx_ctime.tv_sec, status.stx_ctime.tv_nsec};
  if (!table_.stamp(id) || table_.stamp(id) != now) differ.push_back(id);
  return true;
}

void Sweeper::Gone(FolderId id, std::vector<FolderId>& differ) const {
  if (table_.parent(id) != NameTable::kNoFolder) differ.push_back(table_.parent(id));
  for (FolderId each = id; each < table_.subtree_end(id); ++each) differ.push_back(each);
}

void Sweeper::CompareBelow(UniqueFd fd, FolderId id, std::vector<FolderId>& differ) {
  std::vector<FolderId> below;
  const FolderId end = table_.subtree_end(id);
  for (FolderId child = id + 1; child < end && !stopped(); child = table_.subtree_end(child)) {
    if (!Compare(fd.get(), table_.folder_name(child).data(), child, differ)) {
      Gone(child, differ);
    } else if (HasFolders(child)) {
      below.push_back(child);
    }
  }
  queue_.Push(std::move(fd), std::move(below));
}

void Sweeper::Open(const Queue::Task& task, std::vector<FolderId>& differ) {
  const FolderId id = task.folder;
  UniqueFd fd;
  if (task.parent) {
    fd = OpenOnSameMount(task.parent->get(), table_.folder_name(id).data(),
                         O_PATH | O_DIRECTORY | O_NOFOLLOW);
  } else {
    std::vector<std::string_view> names;
    for (FolderId step = id; table_.parent(step) != NameTable::kNoFolder;
         step = table_.parent(step)) {
      names.push_back(table_.folder_name(step));
    }
    fd = OpenByNames(roots_[TreeOf(id)].fd, std::move(names));
  }
  if (fd) return CompareBelow(std::move(fd), id, differ);
  if (errno == EMFILE || errno == ENFILE || errno == ENOMEM) return queue_.Fail(ErrnoError());
  // Gone since it was compared, or a mount point by now.
  Gone(id, differ);
}

Result<std::vector<FolderId>> Sweeper::Sweep() {
  if (roots_.size() != table_.trees()) return ErrnoError(EINVAL);
  std::vector<FolderId> tops;
  for (size_t tree = 0; tree < roots_.size(); ++tree) {
    const FolderId top = table_.top(tree);
    const Result<FolderKey> key = KeyOf(roots_[tree].fd);
    if (!key || *key != table_.key(top)) return ErrnoError(ESTALE, roots_[tree].name);
    if (!Compare(roots_[tree].fd, ".", top, differ_)) return ErrnoError(ESTALE, roots_[tree].name);
    if (HasFolders(top)) tops.push_back(top);
  }
  queue_.Push(UniqueFd(), std::move(tops));
  const Status done =
      queue_.Run(std::max(1U, options_.threads), [this](unsigned, const auto& take) {
        std::vector<FolderId> differ;
        for (Queue::Task task; take(task);) {
          if (stopped()) queue_.Fail(ErrnoError(ECANCELED));
          Open(task, differ);
        }
        const std::lock_guard lock(mutex_);
        differ_.insert(differ_.end(), differ.begin(), differ.end());
      });
  if (!done) return done.error();
  std::sort(differ_.begin(), differ_.end());
  differ_.erase(std::unique(differ_.begin(), differ_.end()), differ_.end());
  return std::move(differ_);
}

}  // namespace

Result<std::vector<FolderId>> SweepFolders(const NameTable& table,
                                           const std::vector<TableRoot>& roots,
                                           const ScanOptions& options) {
  return Sweeper(table, roots, options).Sweep();
}

}  // namespace nas
