#pragma once
// Locations of a search: "/SHARE" or "/SHARE/below", opened under the process's identity so that
// neither ".." nor a symbolic link leads out of the share.

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>

#include "nas/system/shares.h"
#include "nas/system/unique_fd.h"

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

// Opens `name` in the folder `dir`; EXDEV where it is a mount point.
UniqueFd OpenOnSameMount(int dir, const char* name, int flags);

// Opens the folder at `path` below `root` (empty: `root` itself) without following any symbolic
// link; `path` may be longer than a system call takes. Invalid with errno set on failure.
UniqueFd OpenBelow(int root, std::string_view path, int flags);

}  // namespace nas
