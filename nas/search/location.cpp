#include "nas/search/location.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "nas/base/error.h"
#include "nas/base/paths.h"
#include "nas/system/volumes.h"

namespace nas {
namespace {

// Cuts "/SHARE/below" into its share and a path without empty and "." components. False for a
// text that is no location.
bool SplitLocation(std::string_view text, std::string& share, std::string& path) {
  if (!text.starts_with('/') || text.find('\0') != std::string_view::npos) return false;
  while (!text.empty()) {
    text.remove_prefix(1);
    const std::string_view component = text.substr(0, text.find('/'));
    text.remove_prefix(component.size());
    if (component == "..") return false;
    if (component.empty() || component == ".") continue;
    if (share.empty()) {
      share = component;
    } else {
      if (!path.empty()) path.push_back('/');
      path.append(component);
    }
  }
  return !share.empty();
}

// Whether the folder is the temporary folder of a volume, or lies in one.
bool IsTemporary(int folder) {
  const auto path = RealPath("/proc/self/fd/" + std::to_string(folder));
  if (!path) return false;
  return std::ranges::any_of(TemporaryFolders(), [&path](const std::string& name) {
    const auto temporary = RealPath(name);
    return temporary && IsWithin(*path, *temporary);
  });
}

}  // namespace

Result<Location> OpenLocation(const std::string& text) {
  Location location;
  std::string share_name;
  if (!SplitLocation(text, share_name, location.path)) return Error{kErrorIllegal, EINVAL, text};
  const std::optional<Share> share = FindShare(share_name);
  if (!share) return Error{kErrorNoSuchFolder, ENOENT, text};
  location.share = *share;

  const std::string root = share->root.empty() ? "/" : share->root;
  const UniqueFd root_fd(open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!root_fd) return ErrnoError(text);
  location.fd = OpenAt2(root_fd.get(), location.path.empty() ? "." : location.path.c_str(),
                        O_PATH | O_DIRECTORY, RESOLVE_BENEATH | RESOLVE_NO_MAGICLINKS);
  if (!location.fd) return ErrnoError(text);
  // A folder that cannot be read is the location's own error, not one of a search inside it.
  const UniqueFd readable(openat(location.fd.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct stat status;
  if (!readable || fstat(readable.get(), &status) != 0) return ErrnoError(text);
  if (IsTemporary(readable.get())) return Error{kErrorIllegal, EINVAL, text};
  location.device = status.st_dev;
  location.inode = status.st_ino;
  return location;
}

}  // namespace nas
