// User homes: the folders below the share "homes".

#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "nas/base/accounts.h"
#include "nas/base/error.h"
#include "nas/system/share_names.h"
#include "nas/system/shares.h"
#include "platform/system.h"

namespace nas {
namespace {

Result<std::string> HomeOf(const std::string& user) {
  const auto homes = FindShare(kHomesShare);
  if (!homes || !IsUserName(user)) return ErrnoError(ENOENT, user);
  const std::string path = homes->root + "/" + user;
  struct stat info;
  if (lstat(path.c_str(), &info) != 0) return ErrnoError(path);
  if (!S_ISDIR(info.st_mode)) return ErrnoError(ENOTDIR, path);
  return path;
}

}  // namespace
}  // namespace nas

int NUVAServiceHomePathGet(const char* user, char* buffer, size_t size) {
  nas::Result<std::string> home = nas::HomeOf(user == nullptr ? "" : user);
  if (home && (buffer == nullptr || home->size() + 1 > size)) {
    home = nas::ErrnoError(ENAMETOOLONG, *home);
  }
  if (!home) {
    nas::Report(home.error());
    return -1;
  }
  std::memcpy(buffer, home->c_str(), home->size() + 1);
  return 0;
}

int NUVAServiceUserHomeIsEnabled(const char* /*user*/, uid_t /*uid*/) {
  return nas::FindShare(nas::kHomesShare) ? 1 : 0;
}
