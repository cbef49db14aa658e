#pragma once
// Events of a whole file system, by fanotify(7). Takes CAP_SYS_ADMIN, and CAP_DAC_READ_SEARCH to
// find the inode of a file whose name is not told.

#include <memory>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"
#include "nas/index/event_source.h"

namespace nas {

// From now on, of the file system that the folder open at `folder_fd` (not O_PATH) is of. `top_fd`
// is a folder whose mark covers it, where that is another one: of a file system with subvolumes its
// top; -1 otherwise. Both are used for as long as the source lives and stay the caller's.
// With `writes` each write to a file is told; otherwise attributes are not (TellsAttributes).
// EPERM without the rights, EXDEV where the folder's subvolume cannot be marked, EOPNOTSUPP or
// EINVAL, ENODEV where the file system cannot.
Result<std::unique_ptr<EventSource>> WatchFileSystem(int folder_fd, int top_fd, bool writes);

}  // namespace nas
