#pragma once
// Opening folders below one that is open, so that nothing that changes meanwhile leads elsewhere.

#include <string_view>

#include "nas/base/unique_fd.h"

namespace nas {

// Opens `name` in the folder `dir`, close-on-exec. Invalid with errno set: EXDEV where it is a
// mount point. Asked for every folder of a walk, so it carries no Error.
UniqueFd OpenOnSameMount(int dir, const char* name, int flags);

// Opens the folder at `path` below `root` (empty: `root` itself) without following any symbolic
// link; `path` may be longer than a system call takes. Invalid with errno set on failure.
UniqueFd OpenBelow(int root, std::string_view path, int flags);

}  // namespace nas
