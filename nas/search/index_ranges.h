#pragma once
// Entries of an index whose size, times and owners, as the table has them, can be what a search
// asks for: told from the table's columns, one after the other, which takes a fraction of asking
// each entry. What the table is not believed of is always among them.

#include <cstdint>
#include <vector>

#include "nas/index/changes.h"
#include "nas/match/query.h"

namespace nas {

// Does not change once made; any thread may ask. The snapshot and the leaves are borrowed.
class IndexRanges {
 public:
  using EntryId = NameTable::EntryId;

  explicit IndexRanges(const IndexSnapshot& snapshot) : snapshot_(snapshot) {}
  // Another that has to hold: one that asks for attributes, but no kEmpty.
  void Add(const QueryNode& leaf);
  // All leaves are there.
  void Prepare();

  size_t size() const { return leaves_.size(); }
  // The entries of [begin, end) that can be meant, in order. Only with leaves.
  void Find(EntryId begin, EntryId end, std::vector<EntryId>* found) const;
  // Whether the table is not believed of the attributes of this entry, of type DT_*.
  bool Doubts(EntryId entry, unsigned char type) const;
  // Where a process's mappings are not known: whether nobody can have this entry mapped and so
  // change its time without an event.
  bool KnowsTimeOfChange(EntryId entry) const;

 private:
  class Batch;
  static constexpr std::uint64_t kWordBits = 64;
  // Whether a process may have it mapped. A page of a file that has none cannot be written to, and
  // to get one takes an event.
  enum class Mappable : std::uint8_t { kNo, kUnlessEmpty, kYes };
  // Of all entries of a row of classes.
  struct OfClass {
    bool is_out = false;                // by what they share alone
    bool is_unknown = false;            // what the table has of them means nothing
    Mappable mappable = Mappable::kNo;  // kNo where all mappings are known
  };

  static Mappable MappableOf(unsigned char type);
  bool KnowsTimeOfChange(Mappable mappable, EntryId entry) const {
    return mappable == Mappable::kNo ||
           (mappable == Mappable::kUnlessEmpty && snapshot_.table.size(entry) == 0);
  }
  OfClass Judge(const TableClass& row) const;
  void AddDoubtful(EntryId begin, EntryId end, std::vector<EntryId>* found) const;
  bool DoubtsInode(std::uint64_t inode) const {
    if (inode_words_.empty()) return false;
    const std::uint64_t word = inode_words_[inode / kWordBits & (inode_words_.size() - 1)];
    return (word >> (inode % kWordBits) & 1) != 0 && snapshot_.changes.inodes().contains(inode);
  }

  const IndexSnapshot& snapshot_;
  std::vector<const QueryNode*> leaves_;
  std::vector<OfClass> classes_;  // as the table's rows
  std::vector<EntryId> folders_;  // ascending: what lies in them, or elsewhere, changes them
  std::vector<std::uint64_t> inode_words_;  // a bit each, by their last digits; tells most apart
};

}  // namespace nas
