#pragma once
// Locations of a search: "/SHARE" or "/SHARE/below", opened under the process's identity so that
// neither ".." nor a symbolic link leads out of the share.

#include <sys/types.h>

#include <optional>
#include <string>

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

// Nothing, with the last error set: an illegal location, no such share or folder, a file, a folder
// that may not be entered, or one in a volume's temporary folder.
std::optional<Location> OpenLocation(const std::string& text);

}  // namespace nas
