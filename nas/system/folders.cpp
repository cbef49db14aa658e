#include "nas/system/folders.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "nas/base/file_io.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

constexpr mode_t kPermissionBits = 0777;

}  // namespace

Result<UniqueFd> OpenFolder(int dir_fd, const std::string& name) {
  UniqueFd folder(openat(dir_fd, name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!folder) return ErrnoError(name);
  return folder;
}

Result<UniqueFd> OpenOrMakeFolder(int dir_fd, const std::string& name, mode_t mode) {
  Result<UniqueFd> folder = OpenFolder(dir_fd, name);
  if (folder || folder.error().error_number != ENOENT) return folder;
  const ScopedUmask exact(0);
  const bool made = mkdirat(dir_fd, name.c_str(), mode) == 0;
  if (!made && errno != EEXIST) return ErrnoError(name);
  // What is kept in a folder survives no power cut that the folder does not.
  if (made) (void)SyncFolder(dir_fd, ".");
  return OpenFolder(dir_fd, name);
}

Result<UniqueFd> OpenOrMakeFolderFor(uid_t user, gid_t group, int dir_fd, const std::string& name,
                                     mode_t mode) {
  Result<UniqueFd> folder = OpenOrMakeFolder(dir_fd, name, mode);
  if (!folder || geteuid() != 0 || user == 0) return folder;
  struct stat info;
  if (fstat(folder->get(), &info) != 0) return ErrnoError(name);
  if (info.st_uid == 0 && fchownat(folder->get(), "", user, group, AT_EMPTY_PATH) != 0) {
    return ErrnoError(name);
  }
  return folder;
}

Result<UniqueFd> OpenTopFolder(const std::string& path) {
  UniqueFd folder(open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!folder) return ErrnoError(path);
  return folder;
}

Status MakeFolders(const std::string& path, mode_t mode) {
  const ScopedUmask exact(0);
  for (size_t end = path.find('/', 1);; end = path.find('/', end + 1)) {
    const std::string part = path.substr(0, end);
    if (mkdir(part.c_str(), mode) == 0) {
      (void)SyncFolder(AT_FDCWD, part + "/..");
    } else if (errno != EEXIST) {
      // A folder on the way may refuse with another error though it exists.
      const int refusal = errno;
      struct stat info;
      if (stat(part.c_str(), &info) != 0) return ErrnoError(refusal, part);
    }
    if (end == std::string::npos) return {};
  }
}

Status CheckSafeFrom(int folder_fd, uid_t user) {
  struct stat info;
  if (fstat(folder_fd, &info) != 0) return ErrnoError();
  const bool owned = info.st_uid == 0 || info.st_uid == user;
  const bool closed = (info.st_mode & (S_IWGRP | S_IWOTH)) == 0 || (info.st_mode & S_ISVTX) != 0;
  return owned && closed ? Status() : ErrnoError(EPERM, {});
}

Status CheckPrivateTo(int folder_fd, uid_t user) {
  struct stat info;
  if (fstat(folder_fd, &info) != 0) return ErrnoError();
  const bool good = info.st_uid == user && (info.st_mode & kPermissionBits) == S_IRWXU;
  return good ? Status() : ErrnoError(EPERM, {});
}

}  // namespace nas
