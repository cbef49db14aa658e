#pragma once
// One folder's entries with their attributes, in the order of their names.

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "nas/files/directory_reader.h"
#include "nas/index/folder_node.h"

struct statx;

namespace nas {

struct FolderStatus {
  std::uint64_t inode = 0;
  std::uint64_t device = 0;
  std::uint64_t mount = 0;
  NameTable::Stamp stamp;  // {} where it cannot be told from a change that is about to come
  // For the table.
  TableClass access;
  std::uint64_t size = 0;
  std::int64_t mtime = 0;
  std::int64_t crtime = NameTable::Attributes::kNoTime;
};

// Of the folder open at `fd` (O_PATH will do). False with errno set.
bool ReadFolderStatus(int fd, FolderStatus& status);

// For one thread.
class FolderReader {
 public:
  // Both borrowed.
  FolderReader(NodeArena& arena, ClassTable& classes) : arena_(arena), classes_(classes) {}

  // The entries of the folder open at `fd`, sorted; those that are folders (IsFolder) are not
  // looked up. What is gone by then is left out. Until the next call. Ends early where `stopped`.
  std::vector<ReadEntry>& Read(int fd, const std::function<bool()>& stopped);
  int failed() const { return reader_.failed(); }    // errno, of the last Read
  size_t text_bytes() const { return text_bytes_; }  // of the last Read
  bool IsFolder(const ReadEntry& entry) const;
  // Asks for the attributes of an entry of the folder open at `fd`. False where it is gone.
  bool LookUp(int fd, ReadEntry& entry);
  EntryFacts Facts(const FolderStatus& status);

 private:
  void Add(const DirectoryReader::Entry& entry);
  std::uint16_t Row(const TableClass& row);

  NodeArena& arena_;
  ClassTable& classes_;
  DirectoryReader reader_;
  std::vector<ReadEntry> entries_;
  std::string text_;
  size_t text_bytes_ = 0;
  std::unordered_map<std::uint64_t, std::pair<TableClass, std::uint16_t>> rows_;  // asked before
};

}  // namespace nas
