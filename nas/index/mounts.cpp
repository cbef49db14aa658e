#include "nas/index/mounts.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <fstream>
#include <sstream>

namespace nas {

std::optional<Place> PlaceOf(int fd) {
  struct statx status;
  constexpr int kFlags = AT_EMPTY_PATH | AT_STATX_DONT_SYNC | AT_NO_AUTOMOUNT;
  if (statx(fd, "", kFlags, STATX_MNT_ID, &status) != 0) return std::nullopt;
  return Place{std::to_string(status.stx_dev_major) + ":" + std::to_string(status.stx_dev_minor),
               (status.stx_mask & STATX_MNT_ID) != 0 ? status.stx_mnt_id : 0};
}

std::optional<Mount> FindMount(std::uint64_t mount_id) {
  // ID PARENT MAJOR:MINOR ROOT POINT OPTIONS [FIELD...] - TYPE SOURCE OPTIONS
  std::ifstream file(kMountInfo);
  const std::string wanted = std::to_string(mount_id);
  for (std::string line; std::getline(file, line);) {
    std::istringstream words(line);
    std::string id, word;
    Mount mount;
    if (!(words >> id >> word >> mount.device) || id != wanted) continue;
    while (words >> word && word != "-") {
    }
    if (words >> mount.type >> mount.source) return mount;
  }
  return std::nullopt;
}

}  // namespace nas
