#pragma once
// Why one file is not among the results of a search: goes the way to it as the walk would, by the
// same gate, the same reading of folders and the same judge, and tells what refused it first.

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"
#include "nas/files/attributes.h"
#include "nas/search/location.h"
#include "nas/search/refusal.h"
#include "platform/filesearch.h"

namespace nas {

struct Explanation {
  Refusal refusal = Refusal::kNone;
  // Whom it concerns, below the root of the location's share: the file, or a folder on the way.
  std::string path = {};
  int error_number = 0;  // with kFolderUnreadable, kVanished and kFileUnreadable
  std::optional<FileAttributes> attributes = {};  // of the file, where the way leads to it
};

// As of SearchJob and what it is made of; comparators are borrowed.
struct ExplainedSearch {
  const std::vector<Location>& locations;
  const std::vector<FileSearch::FindComp*>& comps;
  bool recursive = true;
  bool search_content = false;
};

// Of the file at `path` (not empty) below the location of that number. Fails where there is no such
// file, or a folder on the way is none (ENOENT, ENOTDIR). Reads the file where contents are asked
// for and can decide. The process must have the user's identity.
Result<Explanation> Explain(const ExplainedSearch& search, size_t number, std::string_view path);

}  // namespace nas
