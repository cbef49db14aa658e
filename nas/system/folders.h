#pragma once
// Making and opening folders one name at a time, by descriptor and never through a symbolic link:
// the way root must go where users can reach.

#include <sys/types.h>

#include <string>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"

namespace nas {

// Opens the folder `name` below `dir_fd`. The descriptor is for going on from (O_PATH). ENOTDIR for
// a symbolic link or anything else that is no folder.
Result<UniqueFd> OpenFolder(int dir_fd, const std::string& name);
// The same, made with exactly `mode` where it is missing. For one thread: it sets the umask.
Result<UniqueFd> OpenOrMakeFolder(int dir_fd, const std::string& name, mode_t mode);
// The same, for `user` when root calls: what is made is handed over to them, and so is a folder of
// root's, which is one that another call makes just now. Only where none but root can put anything.
Result<UniqueFd> OpenOrMakeFolderFor(uid_t user, gid_t group, int dir_fd, const std::string& name,
                                     mode_t mode);
// Opens the folder at an absolute path, from which the administrator's links lead where they will.
Result<UniqueFd> OpenTopFolder(const std::string& path);

// Makes the folders of an absolute path that are missing. Links on the way are followed. For one
// thread, as above.
Status MakeFolders(const std::string& path, mode_t mode);

// EPERM unless nobody but root and `user` can rename or replace what the folder holds: it is
// theirs, and closed to writing by others or sticky.
Status CheckSafeFrom(int folder_fd, uid_t user);
// EPERM unless the folder is `user`'s and nobody else may enter it.
Status CheckPrivateTo(int folder_fd, uid_t user);

}  // namespace nas
