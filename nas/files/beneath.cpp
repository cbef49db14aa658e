#include "nas/files/beneath.h"

#include <fcntl.h>
#include <linux/openat2.h>

#include <cerrno>
#include <climits>
#include <string>

namespace nas {

UniqueFd OpenOnSameMount(int dir, const char* name, int flags) {
  return OpenAt2(dir, name, flags, RESOLVE_NO_XDEV);
}

UniqueFd OpenBelow(int root, std::string_view path, int flags) {
  constexpr unsigned long long kResolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS;
  UniqueFd step;
  while (path.size() >= PATH_MAX) {
    const size_t cut = path.rfind('/', PATH_MAX - 1);
    if (cut == std::string_view::npos) {
      errno = ENAMETOOLONG;
      return UniqueFd();
    }
    step = OpenAt2(step ? step.get() : root, std::string(path.substr(0, cut)).c_str(),
                   O_PATH | O_DIRECTORY, kResolve);
    if (!step) return step;
    path.remove_prefix(cut + 1);
  }
  return OpenAt2(step ? step.get() : root, path.empty() ? "." : std::string(path).c_str(), flags,
                 kResolve);
}

}  // namespace nas
