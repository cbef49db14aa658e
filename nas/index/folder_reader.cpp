#include "nas/index/folder_reader.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <ctime>

namespace nas {
namespace {

constexpr int kFlags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC;
constexpr unsigned kMask = STATX_TYPE | STATX_MODE | STATX_NLINK | STATX_UID | STATX_GID |
                           STATX_INO | STATX_SIZE | STATX_MTIME | STATX_BTIME;
constexpr unsigned kFolderMask = kMask | STATX_CTIME | STATX_MNT_ID;

// The kernel's clock for files goes in steps: a second change within one step leaves the time as it
// is. Steps are at most 10 ms; of whole seconds where that is all the file system keeps.
constexpr std::chrono::nanoseconds kStep = std::chrono::milliseconds(20);
constexpr std::chrono::nanoseconds kLongStep = std::chrono::seconds(2);

NameTable::Stamp StampOf(const statx_timestamp& changed) {
  // That clock itself: where the machine stands still, a step of it takes longer.
  timespec now = {};
  clock_gettime(CLOCK_REALTIME_COARSE, &now);
  const auto age = std::chrono::seconds(now.tv_sec - changed.tv_sec) +
                   std::chrono::nanoseconds(now.tv_nsec - std::int64_t{changed.tv_nsec});
  if (age < (changed.tv_nsec == 0 ? kLongStep : kStep)) return {};
  return {changed.tv_sec, changed.tv_nsec};
}

// False where a time does not fit.
bool PutTimes(std::int64_t mtime, std::int64_t crtime, std::int32_t& to_mtime,
              std::int32_t& to_crtime) {
  to_mtime = static_cast<std::int32_t>(mtime);
  to_crtime = kNoCrtime;
  if (crtime != NameTable::Attributes::kNoTime) {
    to_crtime = static_cast<std::int32_t>(crtime);
    if (to_crtime != crtime || to_crtime == kNoCrtime) return false;
  }
  return to_mtime == mtime;
}

}  // namespace

bool ReadFolderStatus(int fd, FolderStatus& status) {
  struct statx found;
  if (statx(fd, "", kFlags | AT_EMPTY_PATH, kFolderMask, &found) != 0) return false;
  status.inode = found.stx_ino;
  status.device = makedev(found.stx_dev_major, found.stx_dev_minor);
  status.mount = found.stx_mnt_id;
  status.stamp = StampOf(found.stx_ctime);
  status.access = {found.stx_mode, found.stx_uid, found.stx_gid};
  status.size = found.stx_size;
  status.mtime = found.stx_mtime.tv_sec;
  if ((found.stx_mask & STATX_BTIME) != 0) status.crtime = found.stx_btime.tv_sec;
  return true;
}

bool FolderReader::IsFolder(const ReadEntry& entry) const { return entry.row == DT_DIR; }

std::uint16_t FolderReader::Row(const TableClass& row) {
  // Neighbours mostly have the same.
  const std::uint64_t hash =
      row.mode + (std::uint64_t{row.uid} << 17) * 31 + (std::uint64_t{row.gid} << 29) * 37;
  auto& known = rows_[hash];
  if (known.second == 0 || known.first != row) known = {row, classes_.Number(row)};
  return known.second;
}

EntryFacts FolderReader::Facts(const FolderStatus& status) {
  EntryFacts facts;
  facts.inode = status.inode;
  facts.row = DT_DIR;
  if (!PutTimes(status.mtime, status.crtime, facts.mtime, facts.crtime)) return facts;
  facts.size = status.size;
  facts.row = Row(status.access);
  return facts;
}

bool FolderReader::LookUp(int fd, ReadEntry& entry) {
  struct statx found;
  if (statx(fd, entry.Name().data(), kFlags, kMask, &found) != 0) return errno != ENOENT;
  const unsigned char type = IFTODT(found.stx_mode);
  entry.inode = found.stx_ino;
  const bool folder = type == DT_DIR;
  const bool became_one = folder && !IsFolder(entry);
  entry.row = type;
  if (became_one) return true;  // since its name was read; it is read itself
  if (found.stx_nlink > 1 && !folder) return true;
  const std::int64_t crtime =
      (found.stx_mask & STATX_BTIME) != 0 ? found.stx_btime.tv_sec : NameTable::Attributes::kNoTime;
  if (!PutTimes(found.stx_mtime.tv_sec, crtime, entry.mtime, entry.crtime)) return true;
  entry.size = found.stx_size;
  entry.row = Row({found.stx_mode, found.stx_uid, found.stx_gid});
  return true;
}

void FolderReader::Add(const DirectoryReader::Entry& found) {
  ReadEntry entry;
  entry.inode = found.inode;
  entry.row = found.type;
  entry.named = !MakeSearchText(found.name, text_);
  entry.text_bytes = static_cast<std::uint16_t>(text_.size());
  entry.name_bytes = static_cast<std::uint16_t>(found.name.size());
  const size_t bytes = text_.size() + 1 + (entry.named ? found.name.size() + 1 : 0);
  char* to = arena_.Text(bytes);
  entry.text = to;
  std::memcpy(to, text_.c_str(), text_.size() + 1);
  if (entry.named) std::memcpy(to + text_.size() + 1, found.name.data(), found.name.size() + 1);
  text_bytes_ += text_.size() + 1;
  entries_.push_back(entry);
}

std::vector<ReadEntry>& FolderReader::Read(int fd, const std::function<bool()>& stopped) {
  entries_.clear();
  text_bytes_ = 0;
  reader_.Start(fd);
  for (DirectoryReader::Entry entry; !stopped() && reader_.Next(entry);) Add(entry);
  std::sort(entries_.begin(), entries_.end(),
            [](const ReadEntry& a, const ReadEntry& b) { return a.Name() < b.Name(); });
  std::erase_if(entries_, [&](ReadEntry& entry) {
    if (stopped() || IsFolder(entry)) return false;
    if (!LookUp(fd, entry)) return true;
    return false;
  });
  return entries_;
}

}  // namespace nas
