#include "nas/index/table_maker.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <mutex>
#include <utility>

#include "nas/base/file_io.h"
#include "nas/index/table_folders.h"
#include "nas/index/table_sweep.h"
#include "nas/index/tree_scan.h"
#include "nas/system/folders.h"

namespace nas {
namespace {

// What a child tells is sent in pieces of about this size.
constexpr size_t kPieceBytes = size_t{64} << 10;

// A child's words to the watcher. Any thread.
class Telling {
 public:
  explicit Telling(int pipe) : pipe_(pipe) {}
  ~Telling() { (void)WriteAll(pipe_, bytes_); }
  Telling(const Telling&) = delete;
  Telling& operator=(const Telling&) = delete;

  template <typename T>
  void Number(T number) {
    const std::lock_guard lock(mutex_);
    Append(&number, sizeof number);
  }
  // A watch, as ReadWatches takes it: number, length of the key, key.
  void Watch(int watch, const FolderKey& key) {
    const auto length = static_cast<std::uint32_t>(key.size());
    const std::lock_guard lock(mutex_);
    bytes_.append(reinterpret_cast<const char*>(&watch), sizeof watch);
    bytes_.append(reinterpret_cast<const char*>(&length), sizeof length);
    Append(key.data(), key.size());
  }

 private:
  void Append(const void* bytes, size_t length) {
    bytes_.append(static_cast<const char*>(bytes), length);
    if (bytes_.size() < kPieceBytes) return;
    (void)WriteAll(pipe_, bytes_);
    bytes_.clear();
  }

  int pipe_;
  std::mutex mutex_;  // guards bytes_ and the pipe
  std::string bytes_;
};

template <typename T>
bool TakeNumber(std::string_view& bytes, T* number) {
  if (bytes.size() < sizeof *number) return false;
  std::memcpy(number, bytes.data(), sizeof *number);
  bytes.remove_prefix(sizeof *number);
  return true;
}

}  // namespace

std::vector<TableRoot> RootsOf(const Trees& trees) {
  std::vector<TableRoot> roots;
  for (const Trees::Tree& tree : trees.trees()) roots.push_back({tree.folder.get(), tree.path});
  return roots;
}

namespace {

// As many files as there are; 0 where the file system does not count them.
std::uint64_t FilesOf(int folder) {
  struct statvfs status;
  return fstatvfs(folder, &status) == 0 ? status.f_files - status.f_ffree : 0;
}

}  // namespace

TableMaker::TableMaker(const FileSystem& file_system, UniqueFd folder, const Trees& trees,
                       Figures& figures)
    : id_(file_system.id), folder_(std::move(folder)), trees_(&trees), figures_(&figures) {}

Result<TableMaker> TableMaker::Make(const FileSystem& file_system, const std::string& folder,
                                    const Trees& trees, Figures& figures) {
  const Status made = MakeFolders(folder, S_IRWXU);
  if (!made) return made.error();
  UniqueFd opened(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
  if (!opened) return ErrnoError(folder);
  const Status own = CheckPrivateTo(opened.get(), geteuid());
  if (!own) return own.error().Of(folder);
  // Whoever is killed leaves it to the child that still writes for it.
  if (flock(opened.get(), LOCK_EX | LOCK_NB) != 0) return ErrnoError(folder);
  return TableMaker(file_system, std::move(opened), trees, figures);
}

Result<NameTable> TableMaker::OpenTable() const {
  auto table = NameTable::Open(folder_.get(), kTableName, id_);
  if (!table) return table;
  const auto& trees = trees_->trees();
  bool same = table->trees() == trees.size();
  for (size_t at = 0; same && at < trees.size(); ++at) {
    const auto key = KeyOf(trees[at].folder.get());
    same = key && table->top_name(at) == trees[at].path && table->key(table->top(at)) == *key;
  }
  if (!same) return ErrnoError(ESTALE);
  return table;
}

void TableMaker::RemoveTable() const { unlinkat(folder_.get(), kTableName, 0); }

Status TableMaker::Start(Kind kind, const NameTable* table, const Changes& changes) {
  kind_ = kind;
  changed_.clear();
  watches_.clear();
  unwatched_.clear();
  figures_->progress.entries = 0;
  figures_->progress.folders = 0;
  figures_->expected =
      table != nullptr ? table->entries() : FilesOf(trees_->trees().front().folder.get());
  begun_ = std::chrono::steady_clock::now();
  const bool idle = kind == Kind::kScan || kind == Kind::kMergeAll;
  auto job = TableJob::Start(idle, [&](int pipe) {
    return kind == Kind::kSweep ? Sweep(*table, pipe) : MakeTable(kind, table, changes, pipe);
  });
  if (!job) return job.error();
  job_ = std::move(*job);
  return {};
}

void TableMaker::Wait(int timeout_ms) const {
  pollfd readable = {job_->fd(), POLLIN, 0};
  poll(&readable, 1, timeout_ms);
}

int TableMaker::Finish() {
  const int error = job_->Finish();
  took_ = std::chrono::steady_clock::now() - begun_;
  if (error == 0) {
    if (kind_ == Kind::kSweep) {
      ReadChanged(job_->output());
    } else {
      ReadWatches(job_->output());
    }
  }
  job_.reset();
  return error;
}

int TableMaker::Sweep(const NameTable& table, int pipe) const {
  const auto changed = SweepFolders(table, RootsOf(*trees_));
  if (!changed) return changed.error().error_number;
  Telling telling(pipe);
  for (const NameTable::FolderId id : *changed) telling.Number(id);
  return 0;
}

int TableMaker::MakeTable(Kind kind, const NameTable* table, const Changes& changes,
                          int pipe) const {
  Telling telling(pipe);
  ScanOptions options;
  options.progress = &figures_->progress;
  if (InotifySource* by_folder = trees_->by_folder()) {
    options.before_reading = [&telling, by_folder](int fd, const FolderKey& key) {
      telling.Watch(by_folder->Watch(fd), key);
    };
  }
  const TablePlace place = {folder_.get(), kTableName, id_};
  const Status made = kind == Kind::kScan ? ScanTree(RootsOf(*trees_), place, options)
                                          : MergeTable(*table, changes, kind == Kind::kMergeAll,
                                                       RootsOf(*trees_), place, options);
  return made ? 0 : made.error().error_number;
}

void TableMaker::ReadChanged(std::string_view output) {
  for (NameTable::FolderId id = 0; TakeNumber(output, &id);) changed_.push_back(id);
}

void TableMaker::ReadWatches(std::string_view output) {
  int watch = -1;
  std::uint32_t length = 0;
  while (TakeNumber(output, &watch) && TakeNumber(output, &length) && length <= output.size()) {
    FolderKey key(output.substr(0, length));
    output.remove_prefix(length);
    if (watch < 0) {
      unwatched_.push_back(std::move(key));
    } else {
      watches_.emplace(watch, std::move(key));
    }
  }
}

}  // namespace nas
