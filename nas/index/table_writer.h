#pragma once
// Makes a name table: folders in preorder, the entries of each as it comes, then the file. Holds
// the whole table in memory. For one thread; ClassTable is for several.

#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "nas/base/error.h"
#include "nas/index/name_table.h"
#include "nas/index/table_format.h"

namespace nas {

// The text in which an entry is looked for (name_table.h), put into `text`, whose memory is used
// again. Returns whether it is the name itself.
bool MakeSearchText(std::string_view name, std::string& text);

// The rows of mode, user and group that entries share.
class ClassTable {
 public:
  ClassTable();
  // The number of this row; that of "no attributes are known" where there are too many.
  std::uint16_t Number(const TableClass& row);
  std::vector<TableClass> Rows() const;

 private:
  struct Hash {
    size_t operator()(const TableClass& row) const;
  };
  mutable std::mutex mutex_;  // guards both
  std::vector<TableClass> rows_;
  std::unordered_map<TableClass, std::uint16_t, Hash> numbers_;
};

// What is kept of an entry beside its name.
struct EntryFacts {
  std::uint64_t inode = 0;
  std::uint64_t size = 0;
  std::int32_t mtime = 0;
  std::int32_t crtime = kNoCrtime;
  std::uint16_t row = 0;  // of the ClassTable
};

class TableWriter {
 public:
  using FolderId = NameTable::FolderId;
  using EntryId = NameTable::EntryId;
  struct Folder {
    std::uint64_t inode = 0;
    NameTable::Stamp stamp;
    bool unreadable = false;
    FolderKey key;
  };

  // To save the memory of growing; too little does no harm.
  void Reserve(size_t folders, size_t entries, size_t text_bytes);

  // A topmost folder.
  FolderId AddTop(std::string_view name, const Folder& folder);
  // The folder that `entry` of the folder `parent` is. Its entries follow.
  FolderId AddFolder(FolderId parent, EntryId entry, const Folder& folder);
  // An entry of the folder that was added last. In the order of names.
  EntryId AddEntry(std::string_view name, std::string_view text, const EntryFacts& facts);
  // Entries of another table, of which `rows` are the numbers that its classes have here. Their
  // folders are not added.
  EntryId CopyEntries(const NameTable& from, EntryId begin, EntryId end,
                      const std::vector<std::uint16_t>& rows);
  // A folder of another table, and all below it, as the folder that `entry` of `parent` is.
  FolderId CopyTree(const NameTable& from, FolderId top, FolderId parent, EntryId entry,
                    const std::vector<std::uint16_t>& rows);
  // What an added entry is after all.
  void ChangeFacts(EntryId entry, const EntryFacts& facts);

  // Puts the table in the place of `name` in the folder `dir_fd`, durably: written as NAME.new,
  // synced, renamed. The writer is used up. EFBIG where it has more than the format holds.
  Status Write(int dir_fd, const std::string& name, std::string_view file_system,
               std::vector<TableClass> rows);

  size_t entries() const { return classes_.size(); }
  size_t folders() const { return parents_.size(); }

 private:
  void PushFolder(FolderId parent, EntryId entry, const Folder& folder);
  void SetSize(EntryId entry, std::uint64_t size);
  void Finish(std::vector<TableClass>& rows);
  void FinishNames();
  void FinishFolders();
  void FinishClasses(std::vector<TableClass>& rows);
  void FinishOrder();
  void FinishKeys();

  bool too_large_ = false;
  std::string texts_, names_, keys_, top_names_;
  std::vector<std::uint32_t> text_begins_, name_begins_, named_before_, key_begins_, key_slots_;
  std::vector<std::uint64_t> named_;
  std::vector<std::uint32_t> inodes_;
  std::vector<std::uint64_t> wide_inodes_;  // all of them once one does not fit
  std::vector<std::uint32_t> sizes_, large_entries_;
  std::map<EntryId, std::uint64_t> large_;
  std::vector<std::uint64_t> large_sizes_;
  std::vector<std::int32_t> mtimes_, crtimes_;
  std::vector<std::uint16_t> classes_;
  std::vector<std::uint32_t> nearest_first_;
  std::vector<std::uint32_t> folder_entries_, parents_, ends_, entries_begins_, stamp_nanos_;
  std::vector<std::uint64_t> folder_inodes_;
  std::vector<std::int64_t> stamp_seconds_;
  std::vector<std::uint32_t> by_entry_, tops_, top_name_begins_;
};

}  // namespace nas
