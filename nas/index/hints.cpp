#include "nas/index/hints.h"

#include <algorithm>

namespace nas {
namespace {

// So many changed names of one folder cost a search about what reading the folder does, unless it
// is one of the very large ones: there, a name in so many.
constexpr size_t kMostNames = 64;
constexpr size_t kNamesPerEntries = 16;

bool HasStrays(const NameTable& table, NameTable::FolderId folder) {
  const auto first = std::ranges::lower_bound(table.strays(), table.entries_begin(folder));
  return first != table.strays().end() && *first < table.entries_end(folder);
}

}  // namespace

NameTable::FolderId Hints::IdOf(std::string_view folder) const {
  return table_ == nullptr ? NameTable::kNoFolder : table_->Find(folder);
}

void Hints::KeepName(std::string_view folder, Names Kept::*names, std::string_view name) {
  if (!making_) return;
  Names& kept = folders_[std::string(folder)].*names;
  if (kept.contains(name)) return;
  kept.emplace(name);
  ++kept_;
}

void Hints::NameChanged(std::string_view folder, std::string_view name) {
  ++events_;
  if (const auto id = IdOf(folder); id != NameTable::kNoFolder) Note(id, name);
  KeepName(folder, &Kept::names, name);
  CheckBounds();
}

void Hints::TreeCame(std::string_view folder, std::string_view name) {
  ++events_;
  if (const auto id = IdOf(folder); id != NameTable::kNoFolder) NoteTree(id, name);
  KeepName(folder, &Kept::trees, name);
  CheckBounds();
}

void Hints::FolderChanged(std::string_view folder) {
  ++events_;
  if (const auto id = IdOf(folder); id != NameTable::kNoFolder) NoteFolder(id);
  if (making_) {
    Kept& kept = folders_[std::string(folder)];
    kept_ += kept.folder ? 0 : 1;
    kept.folder = true;
  }
  CheckBounds();
}

void Hints::InodeChanged(std::uint64_t inode) {
  ++events_;
  if (table_ != nullptr) changes_.AddInode(inode);
  if (making_ && inodes_.insert(inode).second) ++kept_;
  CheckBounds();
}

void Hints::Lost() {
  ++events_;
  lost_ = true;
}

void Hints::BeginTable() {
  AbandonTable();
  making_ = true;
}

void Hints::AbandonTable() {
  making_ = false;
  folders_.clear();
  inodes_.clear();
  kept_ = 0;
}

void Hints::Use(const NameTable* table) {
  table_ = table;
  changes_ = Changes();
  tree_came_ = false;
  if (table == nullptr) return AbandonTable();
  for (const auto& [key, kept] : folders_) {
    const NameTable::FolderId id = table->Find(key);
    if (id == NameTable::kNoFolder) continue;
    if (kept.folder) NoteFolder(id);
    for (const std::string& name : kept.names) Note(id, name);
    for (const std::string& name : kept.trees) NoteTree(id, name);
  }
  for (const std::uint64_t inode : inodes_) changes_.AddInode(inode);
  AbandonTable();
}

void Hints::ForgetAll() {
  changes_ = Changes();
  tree_came_ = false;
  lost_ = false;
}

void Hints::Note(NameTable::FolderId folder, std::string_view name) {
  const size_t names = changes_.AddName(folder, name);
  const size_t entries = table_->entries_end(folder) - table_->entries_begin(folder);
  if (names > std::max(kMostNames, entries / kNamesPerEntries)) changes_.AddFolder(folder);
  // Its time of change, size and link count go with its names.
  changes_.AddInode(table_->folder_inode(folder));
}

void Hints::NoteTree(NameTable::FolderId folder, std::string_view name) {
  Note(folder, name);
  tree_came_ = true;
}

// Its permissions may have changed, and with them whether the entries can be read or looked up.
void Hints::NoteFolder(NameTable::FolderId folder) {
  changes_.AddInode(table_->folder_inode(folder));
  if (table_->unreadable(folder) || HasStrays(*table_, folder)) changes_.AddFolder(folder);
}

void Hints::CheckBounds() {
  if (changes_.size() > most_ || kept_ > most_) lost_ = true;
}

}  // namespace nas
