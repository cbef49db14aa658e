#include "nas/system/volumes.h"

#include <fcntl.h>
#include <fnmatch.h>
#include <glob.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <utility>

#include "nas/base/random_name.h"
#include "nas/system/config.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

constexpr char kScratchFolder[] = "volume0";
constexpr char kAsidePrefix[] = ".aside-";
constexpr mode_t kPassMode = 0755;
// Without root. Sticky: each user makes and removes their own folder, and no other's.
constexpr mode_t kSharedMode = 01777;
constexpr mode_t kPrivateMode = 0700;

struct Step {
  const char* name;
  mode_t mode;
  mode_t mode_of_root;
};
constexpr Step kResultRoad[] = {{kTemporaryFolder, kPassMode, kPassMode},
                                {"webfm", kPassMode, kPassMode},
                                {"FBSearch", kSharedMode, kPassMode}};

bool IsDirectory(const std::string& path) {
  struct stat info;
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

std::vector<std::string> Expand(const std::string& pattern) {
  glob_t found = {};
  std::vector<std::string> paths;
  if (glob(pattern.c_str(), GLOB_NOSORT, nullptr, &found) == 0) {
    paths.assign(found.gl_pathv, found.gl_pathv + found.gl_pathc);
  }
  globfree(&found);
  return paths;
}

std::string Trimmed(std::string path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  return path;
}

// What ListVolumes would tell, without reading the folders that the patterns name.
bool IsVolume(const std::string& path) {
  const auto matches = [&](const std::string& pattern) {
    return fnmatch(Trimmed(pattern).c_str(), path.c_str(), FNM_PATHNAME | FNM_PERIOD) == 0;
  };
  return path != ScratchVolume() && std::ranges::any_of(CurrentConfig().volumes, matches) &&
         IsDirectory(path);
}

using Opener = Result<UniqueFd> (*)(int dir_fd, const std::string& name, mode_t mode);

Result<UniqueFd> OpenOnly(int dir_fd, const std::string& name, mode_t /*mode*/) {
  return OpenFolder(dir_fd, name);
}

// Goes down to the folder that holds every user's.
Result<UniqueFd> TakeRoad(const std::string& volume, uid_t user, Opener open_step) {
  Result<UniqueFd> folder = OpenTopFolder(volume);
  if (!folder) return folder;
  if (const Status safe = CheckSafeFrom(folder->get(), user); !safe) return safe.error();
  for (const Step& step : kResultRoad) {
    Result<UniqueFd> next =
        open_step(folder->get(), step.name, geteuid() == 0 ? step.mode_of_root : step.mode);
    if (!next) return next;
    if (const Status safe = CheckSafeFrom(next->get(), user); !safe) return safe.error();
    folder = std::move(next);
  }
  return folder;
}

// The path of the user's folder, once it has been opened.
Result<std::string> PathOfOwn(const Result<UniqueFd>& folder, const std::string& volume,
                              const std::string& user) {
  if (!folder) {
    // Something else in its place was put there by somebody: not a missing folder.
    const int cause = folder.error().error_number;
    return ErrnoError(cause == ENOTDIR ? EPERM : cause, user);
  }
  const Status own = CheckPrivateTo(folder->get(), geteuid());
  if (!own) return own.error();
  return ResultFolderPath(volume, user);
}

// Whether results may be kept there for this process's user.
Status CheckResultPlace(const std::string& volume, const std::string& user) {
  // A folder made under another identity would keep its rightful owner out for good.
  const Status own = CheckActsAs(user);
  if (!own || volume == ScratchVolume()) return own;
  return IsVolume(volume) ? Status() : ErrnoError(ENOENT, volume);
}

bool IsSeenByVolumePattern(const std::string& volume) {
  return volume.starts_with("/volume") && volume.find('/', 1) == std::string::npos;
}

bool IsOpenToAll(const struct stat& folder) {
  return folder.st_uid == 0 && (folder.st_mode & (S_IWGRP | S_IWOTH)) != 0;
}

// Whether root has yet to close the folder of users' folders, which it made for all to write in.
bool IsToBeClosed(int road) {
  struct stat info;
  return CanBeRoot() && fstat(road, &info) == 0 && IsOpenToAll(info);
}

Status CloseRoad(int road) {
  struct stat info;
  if (fstat(road, &info) != 0) return ErrnoError();
  if (!IsOpenToAll(info)) return {};
  const UniqueFd folder(openat(road, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return folder && fchmod(folder.get(), kPassMode) == 0 ? Status() : ErrnoError();
}

// What somebody put in the user's place while everybody could. Only its name is touched: what it
// holds, or leads to, is of that somebody's making.
Status MoveStrangerAside(int road, const std::string& user, uid_t owner) {
  struct stat info;
  if (fstatat(road, user.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0) {
    return errno == ENOENT ? Status() : ErrnoError(user);
  }
  if (info.st_uid == owner || info.st_uid == 0) return {};
  const std::string aside = kAsidePrefix + RandomName();
  return renameat(road, user.c_str(), road, aside.c_str()) == 0 ? Status() : ErrnoError(user);
}

Result<UniqueFd> MakeOwnFolder(const std::string& volume, const std::string& user) {
  const uid_t owner = geteuid();
  const gid_t group = getegid();
  const ScopedRoot root;
  const bool as_root = geteuid() == 0;
  if (volume == ScratchVolume()) {
    const Status made = MakeFolders(volume, as_root ? kPassMode : kPrivateMode);
    if (!made) return made.error();
  }
  Result<UniqueFd> road = TakeRoad(volume, owner, OpenOrMakeFolder);
  if (!road) return road;
  Status ready;
  if (as_root) ready = CloseRoad(road->get());
  if (as_root && ready) ready = MoveStrangerAside(road->get(), user, owner);
  if (!ready) return ready.error();
  return OpenOrMakeFolderFor(owner, group, road->get(), user, kPrivateMode);
}

}  // namespace

std::vector<std::string> ListVolumes() {
  std::vector<std::string> volumes;
  for (const std::string& pattern : CurrentConfig().volumes) {
    for (const std::string& found : Expand(pattern)) {
      std::string path = Trimmed(found);
      if (path != ScratchVolume() && IsDirectory(path)) volumes.push_back(std::move(path));
    }
  }
  std::sort(volumes.begin(), volumes.end());
  volumes.erase(std::unique(volumes.begin(), volumes.end()), volumes.end());
  return volumes;
}

std::string ScratchVolume() { return CurrentConfig().state_dir + "/" + kScratchFolder; }

std::vector<std::string> TemporaryFolders() {
  std::vector<std::string> folders = ListVolumes();
  folders.push_back(ScratchVolume());
  for (std::string& folder : folders) folder += std::string("/") + kTemporaryFolder;
  return folders;
}

std::map<std::string, std::string> NamesInSandbox(const std::vector<std::string>& volumes,
                                                  const std::string& scratch) {
  std::map<std::string, std::string> names;
  std::set<std::string> taken;
  for (const std::string& volume : volumes) {
    if (IsSeenByVolumePattern(volume)) taken.insert(names[volume] = volume);
  }
  int number = 0;
  const auto give = [&](const std::string& volume) {
    std::string& name = names[volume];
    while (name.empty() || taken.contains(name)) name = "/volume" + std::to_string(number++);
    taken.insert(name);
  };
  give(scratch);
  for (const std::string& volume : volumes) {
    if (!names.contains(volume)) give(volume);
  }
  return names;
}

std::string ResultFolderPath(const std::string& volume, const std::string& user) {
  std::string path = volume;
  for (const Step& step : kResultRoad) path += std::string("/") + step.name;
  return path + "/" + user;
}

Result<std::string> ResultFolder(const std::string& volume, const std::string& user) {
  const Status good = CheckResultPlace(volume, user);
  if (!good) return good.error();
  const Result<UniqueFd> road = TakeRoad(volume, geteuid(), OpenOnly);
  if (!road) return road.error();
  return PathOfOwn(OpenFolder(road->get(), user), volume, user);
}

Result<std::string> MakeResultFolder(const std::string& volume, const std::string& user) {
  const Status good = CheckResultPlace(volume, user);
  if (!good) return good.error();
  const Result<UniqueFd> road = TakeRoad(volume, geteuid(), OpenOnly);
  if (!road && road.error().error_number != ENOENT) return road.error();
  if (road && !IsToBeClosed(road->get())) {
    Result<std::string> found = PathOfOwn(OpenFolder(road->get(), user), volume, user);
    // Not the user's own is also the folder that another call is just about to hand over.
    const int cause = found ? 0 : found.error().error_number;
    if (cause != ENOENT && cause != EPERM) return found;
  }
  return PathOfOwn(MakeOwnFolder(volume, user), volume, user);
}

void MakeResultFolders(const std::string& user) {
  for (const std::string& volume : ListVolumes()) (void)MakeResultFolder(volume, user);
  (void)MakeResultFolder(ScratchVolume(), user);
}

void RemoveEmptyResultFolders(const std::string& user) {
  std::vector<std::string> volumes = ListVolumes();
  volumes.push_back(ScratchVolume());
  for (const std::string& volume : volumes) {
    if (!ResultFolder(volume, user)) continue;
    const Result<UniqueFd> road = TakeRoad(volume, geteuid(), OpenOnly);
    const ScopedRoot root;
    if (road) unlinkat(road->get(), user.c_str(), AT_REMOVEDIR);
  }
}

Result<std::string> ResultVolume(const std::string& own_volume, const std::string& user) {
  if (!own_volume.empty() && MakeResultFolder(own_volume, user)) return own_volume;
  const Result<std::string> scratch = MakeResultFolder(ScratchVolume(), user);
  if (!scratch) return scratch.error();
  return ScratchVolume();
}

}  // namespace nas
