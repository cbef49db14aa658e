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
  enum class Verdict : std::uint8_t { kNo, kByValue, kMaybe };

  Verdict VerdictOf(const TableClass& row) const;
  void AddDoubtful(EntryId begin, EntryId end, std::vector<EntryId>* found) const;
  bool DoubtsInode(std::uint64_t inode) const;

  const IndexSnapshot& snapshot_;
  std::vector<const QueryNode*> leaves_;
  std::vector<Verdict> verdicts_;  // of each row of classes
  std::vector<EntryId> folders_;   // ascending: what lies in them, or elsewhere, changes them
  std::vector<bool> inode_bits_;   // by their last digits; tells most apart
};

}  // namespace nas
