#pragma once
// Opening a folder by the names that lead to it.

#include <string_view>
#include <vector>

#include "nas/base/unique_fd.h"

namespace nas {

// O_PATH, below the folder open at `root` on the same mount; `names` (NUL-ended) from the innermost
// outwards, and none for the root itself. The path may be longer than a system call takes. Invalid
// with errno set on failure.
UniqueFd OpenByNames(int root, std::vector<std::string_view> names);

}  // namespace nas
