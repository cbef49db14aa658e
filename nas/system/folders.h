#pragma once
// Making and opening folders one name at a time, by descriptor and never through a symbolic link:
// the way root must go where users can reach.

#include <sys/types.h>

#include <string>

#include "nas/base/unique_fd.h"

namespace nas {

// Opens the folder `name` below `dir_fd`, made with exactly `mode` where it is missing. The
// descriptor is for going on from (O_PATH). Empty with errno set; ENOTDIR for a symbolic link or
// anything else that is no folder.
UniqueFd OpenOrMakeFolder(int dir_fd, const std::string& name, mode_t mode);
UniqueFd OpenFolder(int dir_fd, const std::string& name);

// Makes the folders of an absolute path that are missing. Links on the way are followed.
bool MakeFolders(const std::string& path, mode_t mode);

// Whether nobody but root and `user` can rename or replace what the folder holds: it is theirs, and
// closed to writing by others or sticky. Otherwise false with errno EPERM.
bool IsSafeFrom(int folder_fd, uid_t user);
// Whether the folder is `user`'s and nobody else may enter it. Otherwise false with errno EPERM.
bool IsPrivateTo(int folder_fd, uid_t user);

}  // namespace nas
