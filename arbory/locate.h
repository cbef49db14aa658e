#pragma once
// From folders as people name them to locations as the search API takes them.

#include <string>
#include <vector>

#include "nas/system/config.h"
#include "nas/system/shares.h"

namespace arbory {

struct Locations {
  std::vector<std::string> paths;        // "/SHARE" or "/SHARE/below", in the order of the folders
  std::vector<nas::ShareSetting> added;  // shares that must be configured for these paths
};

// A folder inside one of `shares` is reached through it (the innermost one), any other through a
// share of its own. A folder given twice is searched once, and with `recursive` so is one inside
// another. With `repositories` a share of its own begins at the top of the repository that the
// folder lies in, whose ignore files speak of it. Throws UsageError for what is no folder or cannot
// be looked at.
Locations LocateFolders(const std::vector<std::string>& folders,
                        const std::vector<nas::Share>& shares, bool recursive,
                        bool repositories = false);

// The share that holds the folder at `real_path` (empty: the root directory), the innermost where
// there are several; null where there is none.
const nas::Share* InnermostShare(const std::string& real_path,
                                 const std::vector<nas::Share>& shares);

// A name for a share of its own that holds the folder at `real_path`: like the folder's where that
// is allowed and not among `taken`.
std::string FreeShareName(const std::string& real_path, const std::vector<std::string>& taken);

}  // namespace arbory
