#include "nas/index/tree_scan.h"

#include <dirent.h>

#include <algorithm>

#include "nas/index/moved_folders.h"
#include "nas/index/tree_reader.h"

namespace nas {
namespace {

// Numbers folders and entries and writes them.
class TableNumbering {
 public:
  TableNumbering(const std::vector<TableRoot>& roots, const NameTable* old,
                 std::vector<std::uint16_t> rows)
      : roots_(roots), old_(old), rows_(std::move(rows)) {}

  TableWriter& Make(const TreeReader& reader) {
    const size_t old_bytes = old_ == nullptr ? 0 : old_->text_begin(old_->entries());
    writer_.Reserve(reader.folders() + (old_ == nullptr ? 0 : old_->folders()),
                    reader.entries() + (old_ == nullptr ? 0 : old_->entries()),
                    reader.text_bytes() + old_bytes);
    for (const FolderNode* top : reader.tops()) {
      Put({.node = top});
      while (!waiting_.empty()) {
        const Waiting next = waiting_.back();
        waiting_.pop_back();
        Put(next);
      }
    }
    return writer_;
  }

 private:
  // A folder whose entry is written: a node, or, where there is none, one of the old table with all
  // below it.
  struct Waiting {
    const FolderNode* node = nullptr;
    NameTable::FolderId old = NameTable::kNoFolder;
    NameTable::FolderId parent = NameTable::kNoFolder;
    NameTable::EntryId entry = 0;
  };

  void Put(const Waiting& waiting);
  void PutRead(const FolderNode& node, NameTable::FolderId id);
  void PutKept(const FolderNode& node, NameTable::FolderId id);
  bool IsFolder(const FolderNode& node) const {
    return node.state == FolderNode::State::kRead || node.state == FolderNode::State::kKept;
  }

  const std::vector<TableRoot>& roots_;
  const NameTable* old_;
  const std::vector<std::uint16_t> rows_;
  TableWriter writer_;
  std::vector<Waiting> waiting_;
};

void TableNumbering::Put(const Waiting& waiting) {
  if (waiting.node == nullptr) {
    writer_.CopyTree(*old_, waiting.old, waiting.parent, waiting.entry, rows_);
    return;
  }
  const FolderNode& node = *waiting.node;
  if (node.state == FolderNode::State::kKept && node.changed.empty() && node.parent != nullptr) {
    writer_.CopyTree(*old_, node.old, waiting.parent, waiting.entry, rows_);
    return;
  }
  const NameTable::FolderId id =
      node.parent == nullptr ? writer_.AddTop(roots_[node.tree].name, node.folder)
                             : writer_.AddFolder(waiting.parent, waiting.entry, node.folder);
  const size_t before = waiting_.size();
  if (node.state == FolderNode::State::kKept) {
    PutKept(node, id);
  } else {
    PutRead(node, id);
  }
  // Taken from the end, and the first is to be the next.
  std::reverse(waiting_.begin() + static_cast<std::ptrdiff_t>(before), waiting_.end());
}

void TableNumbering::PutRead(const FolderNode& node, NameTable::FolderId id) {
  for (size_t i = 0; i < node.count; ++i) {
    const ReadEntry& entry = node.entries[i];
    const FolderNode* child = entry.child;
    if (child != nullptr && child->state == FolderNode::State::kGone) continue;
    const EntryFacts facts = child != nullptr && child->has_facts ? child->facts : entry.Facts();
    const NameTable::EntryId number = writer_.AddEntry(entry.Name(), entry.Text(), facts);
    if (child != nullptr && IsFolder(*child)) {
      waiting_.push_back({.node = child, .parent = id, .entry = number});
    }
  }
}

void TableNumbering::PutKept(const FolderNode& node, NameTable::FolderId id) {
  const NameTable::EntryId begin = old_->entries_begin(node.old);
  const NameTable::EntryId first =
      writer_.CopyEntries(*old_, begin, old_->entries_end(node.old), rows_);
  auto changed = node.changed.begin();
  const NameTable::FolderId end = old_->subtree_end(node.old);
  for (NameTable::FolderId child = node.old + 1; child < end; child = old_->subtree_end(child)) {
    const NameTable::EntryId entry = old_->folder_entry(child) - begin + first;
    Waiting next{.old = child, .parent = id, .entry = entry};
    if (changed != node.changed.end() && changed->first == child) {
      next.node = (changed++)->second;
      if (next.node->has_facts) writer_.ChangeFacts(entry, next.node->facts);
      if (!IsFolder(*next.node)) continue;
    }
    waiting_.push_back(next);
  }
}

// The folders that changes tell of, by a name in them or an inode.
std::set<NameTable::FolderId> HintedFolders(const NameTable& old, const Changes& changes) {
  std::set<NameTable::FolderId> hinted;
  for (const auto& [folder, in_folder] : changes.folders()) {
    if (folder < old.folders()) hinted.insert(folder);
  }
  if (changes.inodes().empty()) return hinted;
  for (NameTable::EntryId id = 0; id < old.entries(); ++id) {
    if (changes.inodes().contains(old.inode(id))) hinted.insert(old.folder_of(id));
  }
  return hinted;
}

bool HasTheseRoots(const NameTable& old, const std::vector<TableRoot>& roots) {
  if (old.trees() != roots.size()) return false;
  for (size_t i = 0; i < roots.size(); ++i) {
    const FolderKey key = KeyOf(roots[i].fd).value_or({});
    if (key.empty() || key != old.key(old.top(i))) return false;
  }
  return true;
}

Status WriteTable(const TreeReader& reader, const NameTable* old, ClassTable& classes,
                  const std::vector<TableRoot>& roots, const TablePlace& place) {
  DropMovedFolders(reader.tops(), old);
  std::vector<std::uint16_t> rows;
  if (old != nullptr) {
    for (const TableClass& row : old->class_rows()) {
      rows.push_back(rows.size() < kTypeClasses ? static_cast<std::uint16_t>(rows.size())
                                                : classes.Number(row));
    }
  }
  TableNumbering maker(roots, old, std::move(rows));
  return maker.Make(reader).Write(place.dir_fd, place.name, place.file_system, classes.Rows());
}

}  // namespace

Status ScanTree(const std::vector<TableRoot>& roots, const TablePlace& place,
                const ScanOptions& options) {
  ClassTable classes;
  const OldTable none;
  TreeReader reader(roots, none, classes, options);
  const Status read = reader.Read();
  return read ? WriteTable(reader, nullptr, classes, roots, place) : read;
}

Status MergeTable(const NameTable& old, const Changes& changes, bool all_attributes,
                  const std::vector<TableRoot>& roots, const TablePlace& place,
                  const ScanOptions& options) {
  if (all_attributes || !HasTheseRoots(old, roots)) return ScanTree(roots, place, options);
  OldTable from{.table = &old, .hinted = HintedFolders(old, changes)};
  // What is found to be stale is read in the next round. A tree that changes faster has events to
  // tell of it.
  constexpr int kRounds = 3;
  for (int round = 1;; ++round) {
    ClassTable classes;
    TreeReader reader(roots, from, classes, options);
    if (const Status read = reader.Read(); !read) return read;
    std::set<NameTable::FolderId> stale = FoldersLeft(reader.tops(), old);
    stale.insert(reader.stale().begin(), reader.stale().end());
    if (stale.empty() || round == kRounds) {
      return WriteTable(reader, &old, classes, roots, place);
    }
    from.hinted.merge(stale);
  }
}

}  // namespace nas
