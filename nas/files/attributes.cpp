#include "nas/files/attributes.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

namespace nas {
namespace {

constexpr int kFlags = AT_SYMLINK_NOFOLLOW | AT_STATX_DONT_SYNC;
constexpr unsigned kMask = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | STATX_ATIME |
                           STATX_MTIME | STATX_CTIME | STATX_SIZE | STATX_BTIME;

}  // namespace

Result<FileAttributes> ReadAttributes(int folder, const char* name) {
  struct statx status;
  if (statx(folder, name, kFlags, kMask, &status) != 0) return ErrnoError();
  FileAttributes attributes;
  attributes.size = status.stx_size;
  attributes.atime = status.stx_atime.tv_sec;
  attributes.mtime = status.stx_mtime.tv_sec;
  attributes.ctime = status.stx_ctime.tv_sec;
  if ((status.stx_mask & STATX_BTIME) != 0) attributes.crtime = status.stx_btime.tv_sec;
  attributes.mode = status.stx_mode;
  attributes.uid = status.stx_uid;
  attributes.gid = status.stx_gid;
  return attributes;
}

unsigned char ReadType(int folder, const char* name) {
  struct statx status;
  if (statx(folder, name, kFlags, STATX_TYPE, &status) != 0) return DT_UNKNOWN;
  return IFTODT(status.stx_mode);
}

}  // namespace nas
