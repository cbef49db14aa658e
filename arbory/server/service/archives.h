#pragma once
// Rows of a search as one zip archive, made while it is sent by a child that is the user for good,
// as single files are sent (files.h). Folders come with all that lies below them.

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "nas/results/result_reader.h"
#include "nas/system/child.h"

namespace arbory {

// Rows by their place in a listing, in order and apart: each from the first to the last.
using RowRanges = std::vector<std::pair<std::uint64_t, std::uint64_t>>;
// "0-99,105" or "all"; nothing for any other text.
std::optional<RowRanges> ParseRowRanges(const std::string& text);

struct ArchiveRequest {
  std::string user;
  std::string task_id;
  RowRanges rows;
  // The listing that they are rows of.
  std::string sort_by;
  bool descending = false;
  std::string pattern;
  bool head_only = false;
};

// Forks the child, which replies 200 and the archive until it ends; 404 for no such search, 400 for
// a pattern that cannot be understood and for no rows. Names in the archive begin below the folder
// that all rows have in common. Links are left out, as a search does not follow them; what else is
// left out, since it may not be read or there is too much of it, an entry at the end tells. The pid
// is -1 when nothing can be forked.
nas::Child StartArchive(const ArchiveRequest& request);

}  // namespace arbory
