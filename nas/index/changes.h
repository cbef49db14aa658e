#pragma once
// What has happened in a file system since its name table was made, as hints: places to look at
// before the table is believed. The truth is looked up when somebody asks, under that user's
// identity, so neither the order of events nor their repetition matters, and an event costs no
// look-up.
//
//   - A name in a folder of the table: whatever the table says of it is not believed. A search
//   looks
//     it up; where it is a folder that the table does not have in that place, it is walked.
//   - A whole folder: its entries are read, as a walk reads them.
//   - An inode: attributes that the table has of it, under whichever name, are not believed.
//
// Nothing is noted of folders that the table does not know: they lie below a noted name.

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "nas/index/name_table.h"

namespace nas {

class Changes {
 public:
  struct InFolder {
    bool whole = false;
    std::set<std::string, std::less<>> names;  // none where it is `whole`
  };

  // Returns how many names are now noted of the folder; 0 where it is `whole`.
  size_t AddName(NameTable::FolderId folder, std::string_view name);
  void AddFolder(NameTable::FolderId folder);
  void AddInode(std::uint64_t inode);

  // What is noted, in all: names, whole folders and inodes.
  size_t size() const { return names_ + wholes_ + inodes_.size(); }
  size_t whole_folders() const { return wholes_; }

  // By folder number, so that those of one tree follow each other.
  const std::map<NameTable::FolderId, InFolder>& folders() const { return folders_; }
  const std::unordered_set<std::uint64_t>& inodes() const { return inodes_; }

 private:
  std::map<NameTable::FolderId, InFolder> folders_;
  std::unordered_set<std::uint64_t> inodes_;
  size_t names_ = 0;
  size_t wholes_ = 0;
};

// What a search is answered from. Borrowed; does not change while it is used.
struct IndexSnapshot {
  const NameTable& table;
  const Changes& changes;
  // Whether files that are not among the changes have the attributes that the table says. Not so
  // for a while after a time of which no events are known.
  bool attributes_current = false;
  // Whether all files that a process may be writing to by its memory alone are among the changes.
  // Where not, the time of change of a file that may be mapped is not believed.
  bool mappings_known = true;
};

}  // namespace nas
