#include "nas/search/walk_thread.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/statfs.h>

#include <algorithm>
#include <cerrno>

#include "nas/files/beneath.h"

namespace nas {
namespace {

// Files handed out at a time for reading their contents: few enough to spread over the threads.
constexpr size_t kCandidatesInRecord = 64;

constexpr unsigned kAttributeMask = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | STATX_ATIME |
                                    STATX_MTIME | STATX_CTIME | STATX_SIZE | STATX_BTIME;

// File systems without files of anybody's own.
bool IsPseudoFileSystem(int folder) {
  struct statfs status;
  if (fstatfs(folder, &status) != 0) return false;
  switch (static_cast<std::uint32_t>(status.f_type)) {
    case PROC_SUPER_MAGIC:
    case SYSFS_MAGIC:
    case DEBUGFS_MAGIC:
    case TRACEFS_MAGIC:
    case SECURITYFS_MAGIC:
    case SELINUX_MAGIC:
    case CGROUP_SUPER_MAGIC:
    case CGROUP2_SUPER_MAGIC:
    case PSTOREFS_MAGIC:
    case EFIVARFS_MAGIC:
    case BPF_FS_MAGIC:
    case DEVPTS_SUPER_MAGIC:
    case BINFMTFS_MAGIC:
    case BINDERFS_SUPER_MAGIC:
    case NSFS_MAGIC:
    case 0x19800202:  // POSIX message queues
    case 0x62656570:  // configfs
    case 0x65735543:  // FUSE control
    case 0x67596969:  // RPC pipes
      return true;
    default:
      return false;
  }
}

}  // namespace

Criteria::Criteria(const std::vector<FileSearch::FindComp*>& comps) {
  for (const FileSearch::FindComp* comp : comps) {
    if (const auto* named = dynamic_cast<const PatternComp*>(comp);
        named != nullptr && pattern == nullptr) {
      pattern = named;
    } else if (comp->needs() == FileSearch::FindComp::Needs::kAttributes) {
      attribute.push_back(comp);
    } else {
      cheap.push_back(comp);
    }
  }
}

WalkThread::WalkThread(SharedWalk& shared, size_t number) : shared_(shared), number_(number) {
  if (shared.content) scanner_.emplace(*shared.content, shared.stop_flag);
}

void WalkThread::Flush() {
  const std::lock_guard lock(rows_mutex_);
  shared_.writer.Append(rows_);
}

void WalkThread::WalkNames() {
  FolderStack::Item item;
  while (shared_.stack.Take(number_, item)) {
    UniqueFd fd = OpenFolder(item);
    if (fd) ReadFolder(item, std::move(fd));
    if (shared_.stopping()) shared_.stack.Abort();
  }
}

// The folder, or an invalid descriptor where it cannot or shall not be read.
UniqueFd WalkThread::OpenFolder(const FolderStack::Item& item) {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK;
  const bool is_location = item.name == ".";
  // Mount points answer EXDEV, so that every other folder is spared the question what it is on.
  bool crossed = false;
  UniqueFd fd = OpenOnSameMount(item.batch->parent.get(), item.name.data(), kFlags);
  if (!fd && errno == EXDEV) {
    crossed = true;
    fd.Reset(openat(item.batch->parent.get(), item.name.data(), kFlags));
  }
  if (!fd) {
    shared_.progress.AddSkipped(errno);
    return fd;
  }
  if (!is_location && !MayEnter(fd.get(), item.name, crossed)) fd.Reset();
  return fd;
}

bool WalkThread::MayEnter(int fd, std::string_view name, bool crossed) const {
  if (crossed && IsPseudoFileSystem(fd)) return false;
  const bool may_be_temporary = name == "@tmp" && !shared_.never_entered.empty();
  if (!may_be_temporary && shared_.location_ids.empty()) return true;
  struct stat status;
  if (fstat(fd, &status) != 0) return true;
  const std::pair id(status.st_dev, status.st_ino);
  // A location inside another is walked once, as a location.
  return !shared_.never_entered.contains(id) && !shared_.location_ids.contains(id);
}

void WalkThread::ReadFolder(const FolderStack::Item& item, UniqueFd fd) {
  folder_.fd = fd.get();
  folder_.location = item.batch->location;
  folder_.path = item.batch->parent_path;
  folder_.named_in_rows = false;
  if (item.name != ".") {
    if (!folder_.path.empty()) folder_.path.push_back('/');
    folder_.path.append(item.name);
  }
  auto below = std::make_shared<FolderBatch>();
  std::uint64_t entries = 0;
  DirectoryReader::Entry entry;
  reader_.Start(fd.get());
  while (reader_.Next(entry) && !shared_.stopping()) {
    ++entries;
    if (entry.type == DT_UNKNOWN) entry.type = TypeOf(entry.name.data());
    if (entry.type == DT_DIR && shared_.recursive) {
      below->names.append(entry.name).push_back('\0');
    }
    Judge(entry);
  }
  if (reader_.failed() != 0) shared_.progress.AddSkipped(reader_.failed());
  shared_.progress.AddFolder(entries);
  HandOverCandidates();
  if (below->names.empty()) return;
  below->location = folder_.location;
  below->parent_path = folder_.path;
  below->parent = std::move(fd);
  shared_.stack.Push(number_, std::move(below));
}

// Asks for the type that the directory did not tell.
unsigned char WalkThread::TypeOf(const char* name) const {
  struct statx status;
  if (statx(folder_.fd, name, AT_SYMLINK_NOFOLLOW | AT_STATX_DONT_SYNC, STATX_TYPE, &status) != 0) {
    return DT_UNKNOWN;
  }
  return IFTODT(status.stx_mode);
}

void WalkThread::Judge(const DirectoryReader::Entry& entry) {
  folded_.Set(entry.name);
  entry_.name = &folded_;
  entry_.is_dir = entry.type == DT_DIR;
  const Criteria& criteria = shared_.criteria;
  const bool named = criteria.pattern == nullptr || criteria.pattern->match(entry_);
  const bool candidate = !named && shared_.content && entry.type == DT_REG;
  if (!named && !candidate) return;
  for (const FileSearch::FindComp* comp : criteria.cheap) {
    if (!comp->match(entry_)) return;
  }
  FileAttributes attributes;
  if (named || !criteria.attribute.empty()) {
    if (!FetchAttributes(entry.name.data(), attributes)) return;
    entry_.attributes = &attributes;
    if (!AttributesMatch()) return;
  }
  if (named) {
    AddRow(entry.name, attributes);
  } else {
    AddCandidate(entry);
  }
}

bool WalkThread::AttributesMatch() const {
  return std::ranges::all_of(shared_.criteria.attribute, [this](const FileSearch::FindComp* comp) {
    return comp->match(entry_);
  });
}

bool WalkThread::FetchAttributes(const char* name, FileAttributes& attributes) {
  struct statx status;
  if (statx(folder_.fd, name, AT_SYMLINK_NOFOLLOW | AT_STATX_DONT_SYNC, kAttributeMask, &status) !=
      0) {
    shared_.progress.AddSkipped(errno);
    return false;
  }
  attributes.size = status.stx_size;
  attributes.atime = status.stx_atime.tv_sec;
  attributes.mtime = status.stx_mtime.tv_sec;
  attributes.ctime = status.stx_ctime.tv_sec;
  attributes.crtime =
      (status.stx_mask & STATX_BTIME) != 0 ? status.stx_btime.tv_sec : FileAttributes::kNoTime;
  attributes.mode = status.stx_mode;
  attributes.uid = status.stx_uid;
  attributes.gid = status.stx_gid;
  return true;
}

void WalkThread::AddRow(std::string_view name, const FileAttributes& attributes) {
  shared_.progress.AddMatch();
  const std::lock_guard lock(rows_mutex_);
  if (!folder_.named_in_rows) {
    rows_.SetFolder(folder_.location, folder_.path);
    folder_.named_in_rows = true;
  }
  rows_.Add(name, attributes);
  if (rows_.full()) shared_.writer.Append(rows_);
}

void WalkThread::AddCandidate(const DirectoryReader::Entry& entry) {
  candidates_.emplace_back(entry.inode, entry.name);
}

// Files are read in the order of their inodes, which on a rotating disk is nearly that of their
// places.
void WalkThread::HandOverCandidates() {
  if (candidates_.empty()) return;
  std::ranges::sort(candidates_);
  std::string names;
  size_t count = 0;
  for (const auto& [inode, name] : candidates_) {
    names.append(name).push_back('\0');
    if (++count % kCandidatesInRecord == 0 || count == candidates_.size()) {
      shared_.candidates->Add(folder_.location, folder_.path, names);
      names.clear();
    }
  }
  candidates_.clear();
}

void WalkThread::WalkContents() {
  CandidateList::Record record;
  while (!shared_.stopping() && shared_.candidates->Take(record)) ScanRecord(record);
}

void WalkThread::ScanRecord(const CandidateList::Record& record) {
  const Location& location = shared_.locations[record.location];
  folder_.location = record.location;
  folder_.path = record.folder_path;
  folder_.named_in_rows = false;
  // Paths begin at the share, folders are opened from the location.
  std::string_view below = record.folder_path;
  below.remove_prefix(std::min(below.size(), location.path.size()));
  if (below.starts_with('/')) below.remove_prefix(1);
  const UniqueFd fd = OpenBelow(location.fd.get(), below, O_PATH | O_DIRECTORY);
  if (!fd) {
    shared_.progress.AddSkipped(errno);
    return;
  }
  folder_.fd = fd.get();
  for (std::string_view names = record.names; !names.empty() && !shared_.stopping();) {
    const size_t length = names.find('\0');
    ScanFile(names.data());
    names.remove_prefix(length + 1);
  }
}

void WalkThread::ScanFile(const char* name) {
  switch (scanner_->Scan(folder_.fd, name)) {
    case ContentScanner::Result::kMatch: {
      FileAttributes attributes;
      if (FetchAttributes(name, attributes)) AddRow(name, attributes);
      break;
    }
    case ContentScanner::Result::kFailed:
      shared_.progress.AddSkipped(errno);
      break;
    case ContentScanner::Result::kNoMatch:
    case ContentScanner::Result::kStopped:
      break;
  }
}

}  // namespace nas
