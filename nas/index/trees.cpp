#include "nas/index/trees.h"

#include <fcntl.h>
#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>

#include "nas/index/fanotify_source.h"

namespace nas {
namespace {

constexpr int kReading = O_RDONLY | O_DIRECTORY | O_CLOEXEC;
constexpr char kSubvolumes[] = "btrfs";

UniqueFd OpenTree(const std::string& path) {
  const UniqueFd clone(open_tree(AT_FDCWD, path.c_str(), OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC));
  UniqueFd folder(clone ? openat(clone.get(), ".", kReading) : -1);
  if (!folder) folder.Reset(open(path.c_str(), kReading));
  return folder;
}

// The folder that holds all subvolumes, through a mount that nobody else sees: a subvolume cannot
// be marked, and the mark of the whole tells of all of them.
UniqueFd OpenTopOfSubvolumes(const std::string& source) {
  const UniqueFd context(fsopen(kSubvolumes, FSOPEN_CLOEXEC));
  if (!context || fsconfig(context.get(), FSCONFIG_SET_STRING, "source", source.c_str(), 0) != 0 ||
      fsconfig(context.get(), FSCONFIG_SET_STRING, "subvolid", "5", 0) != 0 ||
      fsconfig(context.get(), FSCONFIG_CMD_CREATE, nullptr, nullptr, 0) != 0) {
    return UniqueFd();
  }
  const UniqueFd mount(fsmount(context.get(), FSMOUNT_CLOEXEC, MOUNT_ATTR_RDONLY));
  return UniqueFd(mount ? openat(mount.get(), ".", kReading) : -1);
}

}  // namespace

Result<Trees> Trees::Open(const FileSystem& file_system, bool writes) {
  Trees opened;
  for (const std::string& path : file_system.trees) {
    UniqueFd folder = OpenTree(path);
    if (!folder) return ErrnoError(path);
    opened.trees_.push_back({path, std::move(folder)});
  }
  const int first = opened.trees_.front().folder.get();
  auto whole = WatchFileSystem(first, -1, writes);
  if (!whole && whole.error().error_number == EXDEV && file_system.type == kSubvolumes) {
    opened.top_ = OpenTopOfSubvolumes(file_system.source);
    if (opened.top_) whole = WatchFileSystem(first, opened.top_.get(), writes);
  }
  if (whole) {
    opened.source_ = std::move(*whole);
    return opened;
  }
  if (whole.error().error_number != EPERM) return whole.error().Of(file_system.trees.front());
  auto by_folder = InotifySource::Make();
  if (!by_folder) return by_folder.error();
  opened.by_folder_ = by_folder->get();
  opened.source_ = std::move(*by_folder);
  return opened;
}

}  // namespace nas
