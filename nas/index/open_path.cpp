#include "nas/index/open_path.h"

#include <fcntl.h>
#include <linux/openat2.h>

#include <climits>
#include <string>

#include "nas/files/beneath.h"

namespace nas {

UniqueFd OpenByNames(int root, std::vector<std::string_view> names) {
  constexpr int kFlags = O_PATH | O_DIRECTORY | O_NOFOLLOW;
  constexpr auto kResolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_XDEV;
  UniqueFd fd = OpenOnSameMount(root, ".", kFlags);
  while (fd && !names.empty()) {
    // As many at once as one system call takes.
    std::string path(names.back());
    names.pop_back();
    while (!names.empty() && path.size() + 1 + names.back().size() < PATH_MAX) {
      path.append("/").append(names.back());
      names.pop_back();
    }
    fd = OpenAt2(fd.get(), path.c_str(), kFlags, kResolve);
  }
  return fd;
}

}  // namespace nas
