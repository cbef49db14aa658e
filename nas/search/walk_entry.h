#pragma once
// What the walker knows of one file while its criteria are judged.

#include "nas/files/attributes.h"
#include "nas/match/folded_name.h"
#include "platform/filesearch.h"

namespace FileSearch {

struct WalkEntry {
  nas::FoldedName* name = nullptr;
  bool is_dir = false;
  // Filled before a comparator that needs attributes is asked.
  const nas::FileAttributes* attributes = nullptr;
};

}  // namespace FileSearch
