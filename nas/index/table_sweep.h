#pragma once
// What has changed of a file system while nobody looked.

#include <vector>

#include "nas/base/error.h"
#include "nas/index/name_table.h"
#include "nas/index/tree_scan.h"

namespace nas {

// The folders of the table whose entries may be others than it says: those that have changed since
// their stamp, or have none, ascending. Of one that is not there any more, or is another, the
// folder it was in. Folders below a folder that is not there are not told. Attributes of files
// change without a trace in their folder, so it says nothing of these. The roots are the table's,
// in its order; of `options`, before_reading is called for each folder that is there.
Result<std::vector<NameTable::FolderId>> SweepFolders(const NameTable& table,
                                                      const std::vector<TableRoot>& roots,
                                                      const ScanOptions& options = {});

}  // namespace nas
