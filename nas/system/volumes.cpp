#include "nas/system/volumes.h"

#include <fcntl.h>
#include <glob.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/system/accounts.h"
#include "nas/system/config.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"
#include "nas/system/shares.h"

namespace nas {
namespace {

constexpr char kScratchFolder[] = "volume0";
constexpr mode_t kPassMode = 0755;
// Sticky: each user makes and removes their own folder, and no other's.
constexpr mode_t kSharedMode = 01777;
constexpr mode_t kPrivateMode = 0700;

struct Step {
  const char* name;
  mode_t mode;
};
constexpr Step kResultRoad[] = {
    {kTemporaryFolder, kPassMode}, {"webfm", kPassMode}, {"FBSearch", kSharedMode}};

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

// Goes down the road, as root where it can, since only root may write to a volume itself.
UniqueFd OpenResultRoad(const std::string& volume) {
  const uid_t user = geteuid();
  const ScopedRoot root;
  UniqueFd folder(open(volume.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!folder || !IsSafeFrom(folder.get(), user)) return {};
  for (const Step& step : kResultRoad) {
    folder = OpenOrMakeFolder(folder.get(), step.name, step.mode);
    if (!folder || !IsSafeFrom(folder.get(), user)) return {};
  }
  return folder;
}

bool IsSeenByVolumePattern(const std::string& volume) {
  return volume.starts_with("/volume") && volume.find('/', 1) == std::string::npos;
}

bool MakeScratchVolume() {
  const ScopedRoot root;
  return MakeFolders(ScratchVolume(), geteuid() == 0 ? kPassMode : kPrivateMode);
}

std::string Fail(int error_number) {
  SetLastError(ErrorFromErrno(error_number));
  errno = error_number;
  return {};
}

}  // namespace

std::vector<std::string> ListVolumes() {
  std::vector<std::string> volumes;
  for (const std::string& pattern : CurrentConfig().volumes) {
    for (std::string path : Expand(pattern)) {
      while (path.size() > 1 && path.ends_with('/')) path.pop_back();
      if (path != ScratchVolume() && IsDirectory(path)) volumes.push_back(std::move(path));
    }
  }
  std::sort(volumes.begin(), volumes.end());
  volumes.erase(std::unique(volumes.begin(), volumes.end()), volumes.end());
  return volumes;
}

std::string ScratchVolume() { return CurrentConfig().state_dir + "/" + kScratchFolder; }

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

std::string ResultFolder(const std::string& volume, const std::string& user) {
  const auto account = FindAccount(user);
  if (!account) return {};
  // A folder made under another identity would keep its rightful owner out for good.
  if (account->uid != geteuid()) return Fail(EPERM);
  const std::vector<std::string> volumes = ListVolumes();
  const bool scratch = volume == ScratchVolume();
  if (!scratch && std::find(volumes.begin(), volumes.end(), volume) == volumes.end()) {
    return Fail(ENOENT);
  }
  if (scratch && !MakeScratchVolume()) return Fail(errno);
  const UniqueFd road = OpenResultRoad(volume);
  if (!road) return Fail(errno);
  const UniqueFd folder = OpenOrMakeFolder(road.get(), user, kPrivateMode);
  // Something else in its place was put there by somebody: not a missing folder.
  if (!folder) return Fail(errno == ENOTDIR ? EPERM : errno);
  if (!IsPrivateTo(folder.get(), geteuid())) return Fail(errno);
  return ResultFolderPath(volume, user);
}

std::string ResultVolume(const Share& share, const std::string& user) {
  for (const std::string& volume : {share.volume, ScratchVolume()}) {
    if (!volume.empty() && !ResultFolder(volume, user).empty()) return volume;
  }
  return {};
}

}  // namespace nas
