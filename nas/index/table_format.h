#pragma once
// The layout of a name table's file: a header, then one column after the other, each begun at a
// multiple of kColumnAlignment and filled up with zeros to the next. Numbers are this machine's
// own: a file is made and read on one machine, and made anew where anything about it is unexpected.
//
// The header's sum covers the header, a column's sum the column with its filling, so no byte of the
// file is in no sum. Readers believe nothing before all sums are right. A change of anything here,
// or of what is put into the columns, is a new kTableVersion; there is no reading of older ones.

#include <array>
#include <cstddef>
#include <cstdint>

namespace nas {

inline constexpr std::array<char, 8> kTableMagic = {'A', 'r', 'b', 'N', 'a', 'm', 'e', '\n'};
inline constexpr std::uint32_t kTableVersion = 2;
inline constexpr size_t kColumnAlignment = 64;

enum TableColumn : unsigned {
  // Of entries.
  kTexts,         // NUL-ended
  kTextBegins,    // u32, one more than entries
  kNames,         // NUL-ended, of the entries whose name is not their text
  kNameBegins,    // u32, one more than names in kNames
  kNamed,         // u64 bits: entries that have a name in kNames
  kNamedBefore,   // u32 for each word of kNamed: how many bits are set in those before it
  kInodes,        // u32, or u64 where one of them does not fit
  kSizes,         // u32; kLargeSize where it stands in kLargeSizes
  kLargeEntries,  // u32, ascending
  kLargeSizes,    // u64, of kLargeEntries
  kMtimes,        // i32
  kCrtimes,       // i32; kNoCrtime where the file system does not record it
  kClasses,       // u16: a row of kClassRows
  kClassRows,     // TableClass
  kNearestFirst,  // u32: all entries, those of the shallowest folders first, of these the newest
  // Of folders.
  kFolderEntries,  // u32: the entry that a folder is; UINT32_MAX of a topmost one
  kFolderParents,  // u32
  kFolderEnds,     // u32
  kEntriesBegins,  // u32, one more than folders
  kFolderInodes,   // u64
  kStampSeconds,   // i64
  kStampNanos,     // u32; kUnreadable is set where the folder could not be read
  kKeys,           // bytes
  kKeyBegins,      // u32, one more than folders
  kKeySlots,       // u32, a power of two: a folder, or UINT32_MAX; open addressing by KeyHash
  kByEntry,        // u32: the folders that are entries, by entry
  // Of trees.
  kTops,           // u32: topmost folders, ascending
  kTopNames,       // NUL-ended
  kTopNameBegins,  // u32, one more than trees
  kTableColumns,
};

inline constexpr std::uint32_t kLargeSize = UINT32_MAX;
inline constexpr std::int32_t kNoCrtime = INT32_MIN;
inline constexpr std::uint32_t kUnreadable = 1U << 31;
// Row N, for N below this, is of an entry of type N (DT_*) of which no attributes are known.
inline constexpr std::uint32_t kTypeClasses = 16;

struct TableClass {
  std::uint32_t mode = 0;
  std::uint32_t uid = 0;
  std::uint32_t gid = 0;
  bool operator==(const TableClass&) const = default;
};

struct TableHeader {
  struct Column {
    std::uint64_t begin = 0;
    std::uint64_t bytes = 0;  // without the filling
    std::uint64_t sum = 0;
  };

  std::array<char, 8> magic = kTableMagic;
  std::uint32_t version = kTableVersion;
  std::uint32_t entries = 0;
  std::uint32_t folders = 0;
  std::uint32_t trees = 0;
  std::uint32_t inode_bytes = 0;
  std::array<std::uint32_t, 11> filling = {};
  std::uint64_t file_bytes = 0;
  std::array<char, 48> fold = {};          // FoldVersion, filled with zeros
  std::array<char, 128> file_system = {};  // which one, filled with zeros
  std::array<Column, kTableColumns> columns = {};
  std::uint64_t sum = 0;  // of all before it
};
static_assert(sizeof(TableHeader) % kColumnAlignment == 0, "columns follow at once");

inline constexpr size_t AlignedColumn(size_t bytes) {
  return (bytes + kColumnAlignment - 1) / kColumnAlignment * kColumnAlignment;
}

std::uint64_t TableSum(const void* bytes, size_t count);

}  // namespace nas
