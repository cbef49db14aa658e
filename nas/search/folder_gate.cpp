#include "nas/search/folder_gate.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <string>
#include <string_view>

#include "nas/files/beneath.h"
#include "nas/files/file_systems.h"
#include "nas/system/volumes.h"

namespace nas {

FolderGate::Rules FolderGate::RulesFor(const std::vector<Location>& locations, bool recursive) {
  Rules rules{.recursive = recursive};
  for (const std::string& folder : TemporaryFolders()) {
    struct stat status;
    if (stat(folder.c_str(), &status) == 0) rules.temporary.emplace(status.st_dev, status.st_ino);
  }
  if (locations.size() == 1) return rules;
  for (const Location& location : locations) {
    rules.locations.emplace(location.device, location.inode);
  }
  return rules;
}

FolderGate::Opened FolderGate::Open(int parent, const char* name) const {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK;
  const bool is_location = std::string_view(name) == ".";
  // Mount points answer EXDEV, so that every other folder is spared the question what it is on.
  bool crossed = false;
  UniqueFd fd = OpenOnSameMount(parent, name, kFlags);
  if (!fd && errno == EXDEV) {
    if (!rules_.crosses_mounts) return {UniqueFd(), Refusal::kOtherMount, 0};
    crossed = true;
    fd.Reset(openat(parent, name, kFlags));
  }
  if (!fd) return {UniqueFd(), Refusal::kFolderUnreadable, errno};
  const Refusal refusal = is_location ? Refusal::kNone : MayEnter(parent, fd.get(), name, crossed);
  if (refusal != Refusal::kNone) fd.Reset();
  return {std::move(fd), refusal, 0};
}

namespace {

// Parts of one file system may be on other devices without being mounted there, as a snapshot is.
bool AreOnOneDisk(int one, int other) {
  struct stat first;
  struct stat second;
  return fstat(one, &first) == 0 && fstat(other, &second) == 0 && first.st_dev == second.st_dev;
}

}  // namespace

Refusal FolderGate::MayEnter(int parent, int fd, std::string_view name, bool crossed) const {
  if (pruning_.one_disk && !AreOnOneDisk(parent, fd)) return Refusal::kOtherDisk;
  if (crossed && IsPseudoFileSystem(fd)) return Refusal::kPseudoFileSystem;
  const bool may_be_temporary = name == kTemporaryFolder && !rules_.temporary.empty();
  if (!may_be_temporary && rules_.locations.empty()) return Refusal::kNone;
  struct stat status;
  if (fstat(fd, &status) != 0) return Refusal::kNone;
  const std::pair id(status.st_dev, status.st_ino);
  if (rules_.temporary.contains(id)) return Refusal::kTemporaryFolder;
  return rules_.locations.contains(id) ? Refusal::kOtherLocation : Refusal::kNone;
}

}  // namespace nas
