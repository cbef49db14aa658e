// User homes: the folders below the share "homes".

#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "nas/base/error.h"
#include "nas/system/share_names.h"
#include "nas/system/shares.h"
#include "nas/system/user_state.h"
#include "platform/system.h"

namespace {

int Fail(int error_number) {
  nas::SetLastError(nas::ErrorFromErrno(error_number));
  errno = error_number;
  return -1;
}

}  // namespace

int NUVAServiceHomePathGet(const char* user, char* buffer, size_t size) {
  if (user == nullptr || buffer == nullptr || !nas::IsUserName(user)) return Fail(ENOENT);
  const auto homes = nas::FindShare(nas::kHomesShare);
  if (!homes) return Fail(ENOENT);
  const std::string path = homes->root + "/" + user;
  struct stat info;
  if (lstat(path.c_str(), &info) != 0) return Fail(errno);
  if (!S_ISDIR(info.st_mode)) return Fail(ENOTDIR);
  if (path.size() + 1 > size) return Fail(ENAMETOOLONG);
  std::memcpy(buffer, path.c_str(), path.size() + 1);
  return 0;
}

int NUVAServiceUserHomeIsEnabled(const char* /*user*/, uid_t /*uid*/) {
  return nas::FindShare(nas::kHomesShare) ? 1 : 0;
}
