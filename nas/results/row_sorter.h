#pragma once
// Rows in the order of a column. Orderings of a complete result file are kept in it, so that each
// is made once.

#include <cstdint>
#include <optional>
#include <string_view>

#include "nas/base/sqlite.h"
#include "nas/results/block_reader.h"
#include "nas/results/ordering.h"

namespace nas {

enum class SortColumn {
  kFound = 0,  // the order found
  kName,
  kPath,
  kSize,
  kType,
  kUser,
  kGroup,
  kMode,
  kAtime,
  kMtime,
  kCtime,
  kCrtime,
};
// What clients may sort by. In this order orderings are kept: first those that take long to make.
inline constexpr struct {
  std::string_view word;
  SortColumn column;
} kSortColumns[] = {
    {"name", SortColumn::kName},   {"path", SortColumn::kPath},     {"type", SortColumn::kType},
    {"size", SortColumn::kSize},   {"user", SortColumn::kUser},     {"group", SortColumn::kGroup},
    {"mode", SortColumn::kMode},   {"atime", SortColumn::kAtime},   {"mtime", SortColumn::kMtime},
    {"ctime", SortColumn::kCtime}, {"crtime", SortColumn::kCrtime},
};
// The column that a client calls `word`; nothing for an unknown one.
std::optional<SortColumn> ParseSortColumn(std::string_view word);

// Belongs to one thread, and throws what BlockReader throws.
class RowSorter {
 public:
  // Borrows both; the blocks are open whenever the sorter is asked.
  RowSorter(Database& db, BlockReader& blocks) : db_(db), blocks_(blocks) {}

  // Appends to `out` the rows [offset, offset + limit) of a kept ordering; false where none is
  // kept.
  bool ReadKept(SortColumn column, std::uint64_t offset, std::uint64_t limit, Ordering& out);
  // All rows, ascending. Keeps what it has to make where that pays.
  Ordering OrderingOf(SortColumn column);
  // Whether orderings of these rows are kept at all.
  bool WorthKeeping();

 private:
  Ordering MakeOrdering(SortColumn column);
  Ordering OrderByPath();
  Ordering OrderByType();
  template <typename NameOf>
  Ordering OrderByOwner(std::uint32_t FileAttributes::*id, NameOf name_of);
  void KeepOrdering(SortColumn column, const Ordering& ordering);

  Database& db_;
  BlockReader& blocks_;
};

}  // namespace nas
