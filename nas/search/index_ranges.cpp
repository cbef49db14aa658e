#include "nas/search/index_ranges.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <bit>
#include <iterator>

#include "nas/match/query_match.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

bool OneHolds(const std::vector<Bounds>& bounds, std::int64_t value) {
  return std::ranges::any_of(bounds, [value](const Bounds& one) { return one.Hold(value); });
}

}  // namespace

void IndexRanges::Add(const QueryNode& leaf) { leaves_.push_back(&leaf); }

void IndexRanges::Prepare() {
  // Enough for few to share one.
  constexpr size_t kBitsForInode = 64;
  const NameTable& table = snapshot_.table;
  const Changes& changes = snapshot_.changes;
  // Those below kTypeClasses are of unknown attributes.
  for (const TableClass& row : table.class_rows()) {
    verdicts_.push_back(verdicts_.size() < kTypeClasses ? Verdict::kMaybe : VerdictOf(row));
  }
  folders_ = table.strays();
  for (const auto& [folder, changed] : changes.folders()) {
    const EntryId entry = table.folder_entry(folder);
    if (entry != table.entries()) folders_.push_back(entry);
  }
  std::ranges::sort(folders_);
  if (changes.inodes().empty()) return;
  inode_bits_.resize(std::bit_ceil(changes.inodes().size() * kBitsForInode));
  for (const std::uint64_t inode : changes.inodes()) {
    inode_bits_[inode & (inode_bits_.size() - 1)] = true;
  }
}

IndexRanges::Verdict IndexRanges::VerdictOf(const TableClass& row) const {
  const auto cannot = [&row](const QueryNode* leaf) {
    if (leaf->kind == Kind::kOwner) return !OneHolds(leaf->bounds, row.uid);
    if (leaf->kind == Kind::kGroup) return !OneHolds(leaf->bounds, row.gid);
    // Folders have no size of their own.
    return leaf->kind == Kind::kSize && S_ISDIR(row.mode);
  };
  return std::ranges::any_of(leaves_, cannot) ? Verdict::kNo : Verdict::kByValue;
}

// Most are out of it, or most are in it, but seldom one after the other: so nothing here depends on
// a guess.
void IndexRanges::Find(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const NameTable& table = snapshot_.table;
  found->resize(end - begin);
  size_t count = 0;
  for (EntryId entry = begin; entry < end; ++entry) {
    (*found)[count] = entry;
    count += verdicts_[table.class_row(entry)] == Verdict::kNo ? 0 : 1;
  }
  const auto keep = [&](const std::vector<Bounds>& bounds, const auto& value_of,
                        bool all_known = true) {
    size_t kept = 0;
    for (size_t i = 0; i < count; ++i) {
      const EntryId entry = (*found)[i];
      (*found)[kept] = entry;
      const std::int64_t value = value_of(entry);
      const bool holds = value != QueryAttributes::kNoTime && OneHolds(bounds, value);
      const bool unsure = verdicts_[table.class_row(entry)] == Verdict::kMaybe ||
                          (!all_known && !KnowsTimeOfChange(entry));
      kept += holds || unsure ? 1 : 0;
    }
    count = kept;
  };
  for (const QueryNode* leaf : leaves_) {
    if (leaf->kind == Kind::kSize) {
      keep(leaf->bounds, [&](EntryId id) { return static_cast<std::int64_t>(table.size(id)); });
    } else if (leaf->kind == Kind::kModified) {
      keep(
          leaf->bounds, [&](EntryId id) { return table.mtime(id); }, snapshot_.mappings_known);
    } else if (leaf->kind == Kind::kCreated) {
      keep(leaf->bounds, [&](EntryId id) { return table.crtime(id); });
    }
  }
  found->resize(count);
  AddDoubtful(begin, end, found);
}

void IndexRanges::AddDoubtful(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const auto middle = static_cast<std::ptrdiff_t>(found->size());
  const auto first = std::ranges::lower_bound(folders_, begin);
  found->insert(found->end(), first, std::lower_bound(first, folders_.end(), end));
  const auto among_inodes = static_cast<std::ptrdiff_t>(found->size());
  if (!inode_bits_.empty()) {
    for (EntryId entry = begin; entry < end; ++entry) {
      if (DoubtsInode(snapshot_.table.inode(entry))) found->push_back(entry);
    }
  }
  if (middle == static_cast<std::ptrdiff_t>(found->size())) return;
  std::inplace_merge(found->begin() + middle, found->begin() + among_inodes, found->end());
  std::inplace_merge(found->begin(), found->begin() + middle, found->end());
  found->erase(std::unique(found->begin(), found->end()), found->end());
}

bool IndexRanges::DoubtsInode(std::uint64_t inode) const {
  return !inode_bits_.empty() && inode_bits_[inode & (inode_bits_.size() - 1)] &&
         snapshot_.changes.inodes().contains(inode);
}

bool IndexRanges::Doubts(EntryId entry, unsigned char type) const {
  if (DoubtsInode(snapshot_.table.inode(entry))) return true;
  return type == DT_DIR && std::ranges::binary_search(folders_, entry);
}

// A page of a file that has none cannot be written to: to get one takes an event.
bool IndexRanges::KnowsTimeOfChange(EntryId entry) const {
  if (snapshot_.mappings_known) return true;
  const unsigned char type = snapshot_.table.type(entry);
  if (type == DT_REG) return snapshot_.table.size(entry) == 0;
  return type == DT_DIR || type == DT_LNK || type == DT_FIFO || type == DT_SOCK;
}

}  // namespace nas
