#pragma once
// The attributes of a file, or of a stored row, as a query asks of them.

#include "nas/files/attributes.h"
#include "nas/match/query_match.h"

namespace nas {

static_assert(FileAttributes::kNoTime == QueryAttributes::kNoTime);

inline QueryAttributes AttributesOf(const FileAttributes& file) {
  return {.size = static_cast<std::int64_t>(file.size),
          .modified = file.mtime,
          .created = file.crtime,
          .opened = file.atime,
          .mode = file.mode,
          .uid = file.uid,
          .gid = file.gid};
}

}  // namespace nas
