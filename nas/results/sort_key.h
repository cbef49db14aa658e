#pragma once
// Where a row stands in a sorted listing, as a text that can be compared with that of a row in
// another file, on another machine too: the first page of many results is put together from the
// first rows of each. RowSorter, which sorts the whole of one file, orders its rows the same.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/results/result_reader.h"

namespace nas {

// What an order is made of.
struct KeyedRow {
  std::string_view share;
  std::string_view folder;  // below the share's root
  std::string_view name;
  std::string_view user;
  std::string_view group;
  const FileAttributes* attributes = nullptr;
};

// The byte order of two rows' keys is that of the rows, ascending. Empty for kFound.
std::string SortKey(SortColumn column, const KeyedRow& row);
// The number that a row is sorted by; 0 where it is sorted by a text.
std::uint64_t NumberSortKey(SortColumn column, const FileAttributes& file);

// The numbers of the first `limit` rows in that order, or of the first behind the row `after`,
// purged ones left out; equal ones in the order of their numbers, ascending or not as the others.
// To be asked between Begin and End. Looks at every row and holds as many as it returns.
std::vector<std::uint32_t> FirstRows(ResultReader& reader, SortColumn column, bool ascending,
                                     size_t limit, std::optional<std::uint32_t> after);

}  // namespace nas
