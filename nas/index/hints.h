#pragma once
// From events to Changes: what has happened since the table in use was made, and what has happened
// since another table has been in the making, by the folders' keys, as that one's numbers are not
// known yet.
//
// Bounded: beyond `most` of either, what was kept is worth less than what it takes. It is then
// dropped and lost() says so, and the table has to be compared with the file system.

#include <cstdint>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "nas/index/changes.h"
#include "nas/index/event_source.h"

namespace nas {

class Hints : public EventSink {
 public:
  explicit Hints(size_t most) : most_(most) {}

  void NameChanged(std::string_view folder, std::string_view name) override;
  void TreeCame(std::string_view folder, std::string_view name) override;
  void FolderChanged(std::string_view folder) override;
  void InodeChanged(std::uint64_t inode) override;
  void Lost() override;

  // Of the table that is used next, which is not looked at before Use: from now on events are kept
  // for it as well.
  void BeginTable();
  void AbandonTable();
  // The table in use from now on, lent until the next Use; null for none, and nothing is noted.
  // What was kept since BeginTable is all that is known to have changed since it was made.
  void Use(const NameTable* table);
  // Forgets that events were lost, with all that is known of the table in use.
  void ForgetAll();

  // Told by whoever has looked: the folder's entries are not those of the table.
  void AddFolder(NameTable::FolderId folder) { changes_.AddFolder(folder); }

  const Changes& changes() const { return changes_; }
  // For a child, which may add to its copy.
  Changes& changes() { return changes_; }
  size_t kept() const { return kept_; }  // for the table in the making
  bool lost() const { return lost_; }
  bool tree_came() const { return tree_came_; }
  std::uint64_t events() const { return events_; }

 private:
  using Names = std::set<std::string, std::less<>>;
  struct Kept {
    bool folder = false;
    Names names;
    Names trees;
  };

  // In the table in use; kNoFolder where that does not know it.
  NameTable::FolderId IdOf(std::string_view folder) const;
  void KeepName(std::string_view folder, Names Kept::*names, std::string_view name);
  void Note(NameTable::FolderId folder, std::string_view name);
  void NoteTree(NameTable::FolderId folder, std::string_view name);
  void NoteFolder(NameTable::FolderId folder);
  void CheckBounds();

  size_t most_;
  const NameTable* table_ = nullptr;
  Changes changes_;
  bool making_ = false;
  std::unordered_map<std::string, Kept> folders_;
  std::unordered_set<std::uint64_t> inodes_;
  size_t kept_ = 0;
  bool lost_ = false;
  bool tree_came_ = false;
  std::uint64_t events_ = 0;
};

}  // namespace nas
