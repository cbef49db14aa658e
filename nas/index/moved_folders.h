#pragma once
// Folders that were met in two places, because they, or a folder around them, were moved while the
// tree was read. A table has each folder once: otherwise an event in it would be noted of one of
// its places and a search would believe the other.

#include <set>
#include <vector>

#include "nas/index/folder_node.h"
#include "nas/index/name_table.h"

namespace nas {

// Of two nodes of one folder the one that was looked at earlier becomes kElsewhere: the events of
// the move tell of both names. So does one of a folder that is taken from `old`, which may be null,
// in another place.
void DropMovedFolders(const std::vector<FolderNode*>& tops, const NameTable* old);

// Folders of `old` in which a folder is kept that has been met as a new one elsewhere.
std::set<NameTable::FolderId> FoldersLeft(const std::vector<FolderNode*>& tops,
                                          const NameTable& old);

}  // namespace nas
