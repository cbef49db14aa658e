#include "nas/index/changes.h"

namespace nas {

size_t Changes::AddName(NameTable::FolderId folder, std::string_view name) {
  InFolder& noted = folders_[folder];
  if (noted.whole) return 0;
  if (!noted.names.contains(name)) {
    noted.names.emplace(name);
    ++names_;
  }
  return noted.names.size();
}

void Changes::AddFolder(NameTable::FolderId folder) {
  InFolder& noted = folders_[folder];
  if (noted.whole) return;
  noted.whole = true;
  ++wholes_;
  names_ -= noted.names.size();
  noted.names.clear();
}

void Changes::AddInode(std::uint64_t inode) { inodes_.insert(inode); }

}  // namespace nas
