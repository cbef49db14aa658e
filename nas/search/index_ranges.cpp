#include "nas/search/index_ranges.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <iterator>
#include <limits>
#include <span>

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
  const NameTable& table = snapshot_.table;
  const Changes& changes = snapshot_.changes;
  for (const TableClass& row : table.class_rows()) {
    const bool known = classes_.size() >= kTypeClasses;
    classes_.push_back(known ? Judge(row) : OfClass{false, true, Mappable::kNo});
  }
  folders_ = table.strays();
  for (const auto& [folder, changed] : changes.folders()) {
    const EntryId entry = table.folder_entry(folder);
    if (entry != table.entries()) folders_.push_back(entry);
  }
  std::ranges::sort(folders_);
  if (changes.inodes().empty()) return;
  // So many bits that few inodes share one.
  inode_words_.resize(std::bit_ceil(changes.inodes().size()));
  for (const std::uint64_t inode : changes.inodes()) {
    const std::uint64_t bit = std::uint64_t{1} << (inode % kWordBits);
    inode_words_[inode / kWordBits & (inode_words_.size() - 1)] |= bit;
  }
}

IndexRanges::OfClass IndexRanges::Judge(const TableClass& row) const {
  const auto cannot = [&row](const QueryNode* leaf) {
    if (leaf->kind == Kind::kOwner) return !OneHolds(leaf->bounds, row.uid);
    if (leaf->kind == Kind::kGroup) return !OneHolds(leaf->bounds, row.gid);
    // Folders have no size of their own.
    return leaf->kind == Kind::kSize && S_ISDIR(row.mode);
  };
  const auto mappable = snapshot_.mappings_known ? Mappable::kNo : MappableOf(IFTODT(row.mode));
  return {std::ranges::any_of(leaves_, cannot), false, mappable};
}

IndexRanges::Mappable IndexRanges::MappableOf(unsigned char type) {
  if (type == DT_REG) return Mappable::kUnlessEmpty;
  const bool has_no_pages = type == DT_DIR || type == DT_LNK || type == DT_FIFO || type == DT_SOCK;
  return has_no_pages ? Mappable::kNo : Mappable::kYes;
}

// Entries that follow each other and are still meant: as many as stay in the processor's nearest
// memory while one criterion after the other is asked. At first in a way that takes many entries at
// a time and may leave some too many, then one by one; of these most are out of it, or most are in
// it, but seldom one after the other, so nothing there depends on a guess.
class IndexRanges::Batch {
 public:
  static constexpr size_t kMost = 2048;

  explicit Batch(const IndexRanges& ranges)
      : ranges_(ranges), table_(ranges.snapshot_.table), classes_(ranges.classes_) {}

  void Begin(EntryId begin, EntryId end) {
    const size_t size = end - begin;
    meant_.fill(1);
    for (const QueryNode* leaf : ranges_.leaves_) Narrow(*leaf, begin, size);
    const std::uint16_t* classes = table_.class_rows_from(begin);
    for (size_t i = 0; i < size; ++i) meant_[i] |= classes[i] < kTypeClasses ? 1 : 0;
    count_ = 0;
    for (size_t i = 0; i < size; ++i) {
      // Eight are often none.
      std::uint64_t eight = 0;
      while (i + sizeof(eight) <= size) {
        std::memcpy(&eight, meant_.data() + i, sizeof(eight));
        if (eight != 0) break;
        i += sizeof(eight);
      }
      if (i == size) break;
      entries_[count_] = begin + static_cast<EntryId>(i);
      count_ += meant_[i] != 0 && !classes_[classes[i]].is_out ? 1 : 0;
    }
  }

  void Keep(const QueryNode& leaf) {
    if (leaf.bounds.size() == 1) {
      Keep(leaf.kind, [bounds = leaf.bounds.front()](std::int64_t v) { return bounds.Hold(v); });
    } else {
      Keep(leaf.kind, [&leaf](std::int64_t value) { return OneHolds(leaf.bounds, value); });
    }
  }

  std::span<const EntryId> entries() const { return {entries_.data(), count_}; }

 private:
  const OfClass& ClassOf(EntryId entry) const { return classes_[table_.class_row(entry)]; }

  void Narrow(const QueryNode& leaf, EntryId begin, size_t size) {
    Bounds all = {Bounds::kMost, Bounds::kLeast};
    for (const Bounds& one : leaf.bounds) {
      all = {std::min(all.from, one.from), std::max(all.to, one.to)};
    }
    if (leaf.kind == Kind::kSize) {
      // The largest stands for all that are as large or larger.
      NarrowTo(table_.sizes_from(begin), size, all);
    } else if (leaf.kind == Kind::kModified && ranges_.snapshot_.mappings_known) {
      NarrowTo(table_.mtimes_from(begin), size, all);
    } else if (leaf.kind == Kind::kCreated) {
      NarrowTo(table_.crtimes_from(begin), size, all);
    }
  }

  template <class Value>
  void NarrowTo(const Value* values, size_t size, const Bounds& bounds) {
    constexpr std::int64_t kLeast = std::numeric_limits<Value>::min();
    constexpr std::int64_t kGreatest = std::numeric_limits<Value>::max();
    const auto from = static_cast<Value>(std::clamp(bounds.from, kLeast, kGreatest));
    const auto to = static_cast<Value>(std::clamp(bounds.to, kLeast, kGreatest));
    for (size_t i = 0; i < size; ++i) meant_[i] &= values[i] >= from && values[i] <= to ? 1 : 0;
  }

  template <class Holds>
  void Keep(Kind kind, const Holds& holds) {
    if (kind == Kind::kSize) {
      KeepIf([&](EntryId id) {
        return holds(static_cast<std::int64_t>(table_.size(id))) || ClassOf(id).is_unknown;
      });
    } else if (kind == Kind::kModified) {
      KeepIf([&](EntryId id) {
        const OfClass& all = ClassOf(id);
        return holds(table_.mtime(id)) || all.is_unknown ||
               !ranges_.KnowsTimeOfChange(all.mappable, id);
      });
    } else if (kind == Kind::kCreated) {
      KeepIf([&](EntryId id) {
        const std::int64_t time = table_.crtime(id);
        return (time != QueryAttributes::kNoTime && holds(time)) || ClassOf(id).is_unknown;
      });
    }
  }

  template <class IsMeant>
  void KeepIf(const IsMeant& is_meant) {
    size_t kept = 0;
    for (size_t i = 0; i < count_; ++i) {
      const EntryId entry = entries_[i];
      entries_[kept] = entry;
      kept += is_meant(entry) ? 1 : 0;
    }
    count_ = kept;
  }

  const IndexRanges& ranges_;
  const NameTable& table_;
  const std::span<const OfClass> classes_;
  std::array<std::uint8_t, kMost> meant_;
  std::array<EntryId, kMost> entries_;
  size_t count_ = 0;
};

void IndexRanges::Find(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  found->clear();
  Batch batch(*this);
  for (EntryId from = begin; from < end;) {
    const EntryId next = from + std::min<EntryId>(end - from, Batch::kMost);
    batch.Begin(from, next);
    for (const QueryNode* leaf : leaves_) batch.Keep(*leaf);
    found->insert(found->end(), batch.entries().begin(), batch.entries().end());
    from = next;
  }
  AddDoubtful(begin, end, found);
}

void IndexRanges::AddDoubtful(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const auto middle = static_cast<std::ptrdiff_t>(found->size());
  const auto first = std::ranges::lower_bound(folders_, begin);
  found->insert(found->end(), first, std::lower_bound(first, folders_.end(), end));
  const auto among_inodes = static_cast<std::ptrdiff_t>(found->size());
  if (!inode_words_.empty()) {
    for (EntryId entry = begin; entry < end; ++entry) {
      if (DoubtsInode(snapshot_.table.inode(entry))) found->push_back(entry);
    }
  }
  if (middle == static_cast<std::ptrdiff_t>(found->size())) return;
  std::inplace_merge(found->begin() + middle, found->begin() + among_inodes, found->end());
  std::inplace_merge(found->begin(), found->begin() + middle, found->end());
  found->erase(std::unique(found->begin(), found->end()), found->end());
}

bool IndexRanges::Doubts(EntryId entry, unsigned char type) const {
  if (DoubtsInode(snapshot_.table.inode(entry))) return true;
  return type == DT_DIR && std::ranges::binary_search(folders_, entry);
}

bool IndexRanges::KnowsTimeOfChange(EntryId entry) const {
  const NameTable& table = snapshot_.table;
  return snapshot_.mappings_known || KnowsTimeOfChange(MappableOf(table.type(entry)), entry);
}

}  // namespace nas
