#pragma once
// Locations of a search: "/SHARE" or "/SHARE/below", opened under the process's identity so that
// neither ".." nor a symbolic link leads out of the share.

#include <sys/types.h>

#include <string>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"
#include "nas/system/shares.h"

namespace nas {

struct Location {
  Share share;
  std::string path;  // below the share's root, no leading or final "/"; empty for the root itself
  UniqueFd fd;       // the folder, O_PATH
  dev_t device = 0;
  ino_t inode = 0;
};

// Fails for a text that is no location or leads out of its share, and for a volume's temporary
// folder or one in it (kErrorIllegal); where there is no such share or folder, or a file
// (kErrorNoSuchFolder); for a folder that may not be read (kErrorPermission). The error's path is
// `text`. The process must have the user's identity.
Result<Location> OpenLocation(const std::string& text);

}  // namespace nas
