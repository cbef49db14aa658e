#pragma once
// The reading end of a result database: rows by number, orderings, selections and purging.
//
// A reader belongs to one thread of one process. Between Begin and End it sees one state of the
// file, whatever a worker appends meanwhile. Whatever asks the file throws SqliteError where it
// cannot be read, and std::runtime_error or std::out_of_range where it is damaged; Begin may be
// called again after that.

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include "nas/base/sqlite.h"
#include "nas/match/query.h"
#include "nas/results/block_reader.h"
#include "nas/results/foreign_accounts.h"
#include "nas/results/row_sorter.h"

namespace nas {

struct Selection {
  SortColumn column = SortColumn::kFound;
  bool ascending = true;
  std::optional<bool> directories;  // only folders, or only others
  std::optional<Query> pattern;     // judged by what a row holds
  bool filters() const { return directories || pattern; }
};

class ResultReader {
 public:
  // Throws SqliteError, or std::runtime_error for a file of another version.
  explicit ResultReader(const std::string& path);
  ~ResultReader();
  ResultReader(const ResultReader&) = delete;
  ResultReader& operator=(const ResultReader&) = delete;

  // Begin throws SqliteError too where another holds the file for longer than
  // kResultBusyMilliseconds. What lies in between is asked only between the two.
  void Begin();
  void End();

  // A page of the rows that pass, in their order, and how many pass in all.
  struct Page {
    std::vector<std::uint32_t> numbers;  // for Row
    std::uint64_t total = 0;
  };
  // `limit` rows at most, from the one at `offset` on. With a column that has no kept ordering it
  // sorts all rows, which takes some 100 bytes of memory a row.
  Page Select(const Selection& selection, std::uint64_t offset, std::uint64_t limit);
  // Whether the row was marked when Begin looked.
  bool purged(std::uint32_t row) const { return purged_.contains(row); }
  // How many rows there are, purged ones included; they are numbered from 0.
  std::uint64_t rows() const { return blocks_.rows(); }
  ResultRow Row(std::uint32_t number) { return blocks_.Row(number); }
  // Throws SqliteError.
  ForeignAccounts Accounts() { return ForeignAccounts(db_); }

  // Sorts by every column and keeps the orderings that are not yet kept, so that listings need not.
  // Stops between columns where a file is not complete or has been deleted.
  void KeepAllOrderings();

  // Marks rows as purged, outside Begin and End. Throws SqliteError where that cannot be stored;
  // this reader leaves them out from now on all the same.
  void Purge(const std::vector<std::uint32_t>& numbers);

 private:
  void ReadPurged();
  std::vector<bool> Passing(const Selection& selection);
  void FilterByQuery(const Query& query, std::vector<bool>& passes);

  const std::string path_;
  Database db_;
  std::optional<Transaction> transaction_;
  BlockReader blocks_{db_, path_};
  RowSorter sorter_{db_, blocks_};
  std::unordered_set<std::uint32_t> purged_;
  std::unordered_set<std::uint32_t> purged_here_;  // by this reader, stored or not
};

}  // namespace nas
