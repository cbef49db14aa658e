#pragma once
// The reading end of a result database: rows by number, orderings, selections and purging.
//
// A reader belongs to one process. Between Begin and End it sees one state of the file, whatever a
// worker appends meanwhile.

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

#include "nas/base/sqlite.h"
#include "nas/match/name_pattern.h"
#include "nas/results/ordering.h"
#include "nas/results/result_file.h"

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
// The column that a client calls `word`; nothing for an unknown one.
std::optional<SortColumn> ParseSortColumn(std::string_view word);

struct Selection {
  SortColumn column = SortColumn::kFound;
  bool ascending = true;
  std::optional<bool> directories;  // only folders, or only others
  std::optional<NamePattern> pattern;
  bool filters() const { return directories || pattern; }
};

// One row, valid until the reader is asked for another.
struct ResultRow {
  std::string_view share_name;
  std::string_view share_root;
  std::string_view folder;  // below the share's root; empty for the root itself
  std::string_view name;
  const FileAttributes* attributes = nullptr;
};

class ResultReader {
 public:
  // Throws SqliteError, or std::runtime_error for a file of another version.
  explicit ResultReader(const std::string& path);

  void Begin();
  void End();

  // A page of the rows that pass, in their order, and how many pass in all.
  struct Page {
    std::vector<std::uint32_t> numbers;  // for Row
    std::uint64_t total = 0;
  };
  Page Select(const Selection& selection, std::uint64_t offset, std::uint64_t limit);
  bool purged(std::uint32_t row) const { return purged_.contains(row); }
  // How many rows there are, purged ones included.
  std::uint64_t rows() const { return rows_; }
  ResultRow Row(std::uint32_t number);

  // Sorts by every column and keeps the orderings that are not yet kept, so that listings need not.
  // Stops between columns where a file is not complete or has been deleted.
  void KeepAllOrderings();

  // Marks rows as purged, outside Begin and End. Throws SqliteError.
  void Purge(const std::vector<std::uint32_t>& numbers);

  // The owners' names, or the number in decimal where there is none.
  const std::string& UserName(std::uint32_t uid);
  const std::string& GroupName(std::uint32_t gid);

 private:
  struct Location {
    std::string share_name;
    std::string share_root;
  };
  struct Folder {
    std::uint16_t location;
    std::string_view path;
  };
  // The names side of a block, taken apart. Views point into its own bytes.
  struct Names {
    std::string bytes;
    std::vector<Folder> folders;
    std::vector<std::string_view> names;  // those asked for so far
    size_t rest = 0;                      // where in `bytes` the others begin
  };
  // The attributes are read in pieces of kPieceRows rows, each when one of its rows is asked for: a
  // short page needs few of a block's, and to copy them all would be most of its making.
  struct Block {
    Names names;
    size_t rows = 0;
    std::map<size_t, std::vector<FileAttributes>> pieces;  // by first row in the block
  };

  static void TakeApart(std::string_view folders, std::string_view names, Names& out);
  void ReadPurged();
  static void ParseNames(Names& names, size_t count);
  Block& BlockOf(std::uint32_t number, std::uint64_t& first);
  void OpenAttributes(std::int64_t first);
  const FileAttributes& AttributesIn(Block& block, std::uint64_t first, size_t index);
  template <typename Visitor>
  void ForEachNames(Visitor visit);
  template <typename Visitor>
  void ForEachAttributes(Visitor visit);
  std::vector<bool> Passing(const Selection& selection);
  bool ReadKept(SortColumn column, std::uint64_t offset, std::uint64_t limit, Ordering& out);
  Ordering OrderingOf(SortColumn column);
  Ordering MakeOrdering(SortColumn column);
  Ordering OrderByPath();
  Ordering OrderByType();
  template <typename NameOf>
  Ordering OrderByOwner(std::uint32_t FileAttributes::*id, NameOf name_of);
  void KeepOrdering(SortColumn column, const Ordering& ordering);

  bool complete();

  const std::string path_;
  Database db_;
  std::optional<Transaction> transaction_;
  std::uint64_t rows_ = 0;
  std::map<std::uint16_t, Location> locations_;
  std::unordered_set<std::uint32_t> purged_;
  std::map<std::uint64_t, Block> blocks_;  // by first row
  // Of the block read last. Open only between Begin and End, as it holds their transaction.
  std::optional<Blob> attributes_;
  std::int64_t attributes_of_ = 0;
  std::map<std::uint32_t, std::string> user_names_;
  std::map<std::uint32_t, std::string> group_names_;
};

}  // namespace nas
