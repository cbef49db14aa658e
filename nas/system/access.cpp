// What a user may do with a file, as the system itself judges it: mode bits, groups and ACLs.

#include <acl/libacl.h>
#include <fcntl.h>
#include <unistd.h>

#include "platform/system.h"
#include "platform/webfm.h"

int NUVAACLIsSupport(const char* path, int /*fd*/, int /*flags*/) {
  if (path == nullptr || *path == '\0') return 0;
  return acl_extended_file(path) > 0 ? 1 : 0;
}

int GetACLPrivilege(const char* path) {
  if (path == nullptr || *path == '\0') return 0;
  int privilege = 0;
  for (const int bit : {X_OK, W_OK, R_OK}) {
    if (faccessat(AT_FDCWD, path, bit, AT_EACCESS) == 0) privilege |= bit;
  }
  return privilege;
}
