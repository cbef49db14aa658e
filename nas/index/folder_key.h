#pragma once
// What a folder is known by for as long as it lives, through renames and mounts: the file system's
// own handle for it. Inode numbers are used again and repeat between subvolumes; handles do not.

#include <string>
#include <string_view>

#include "nas/base/error.h"

namespace nas {

// The handle's type and its bytes, as name_to_handle_at(2) and the events of fanotify(7) have them.
// Keys are of one file system: two file systems may have equal ones.
using FolderKey = std::string;

// Of the folder open at `fd` (O_PATH will do). Fails with EOPNOTSUPP where the file system has no
// handles.
Result<FolderKey> KeyOf(int fd);
// Of the folder `name` in the folder open at `fd`; not followed where it is a symbolic link.
Result<FolderKey> KeyOf(int fd, const char* name);
// From what an event tells of a folder.
FolderKey MakeFolderKey(int handle_type, std::string_view handle);

}  // namespace nas
