#pragma once
// Reads a search's rows from its result file as they come, and turns them into the bytes to print.
// The file is read without the module, whose listings are made for pages of a hundred: a program
// that prints a million rows would pay for each what a form of JSON costs.

#include <cstdint>
#include <memory>
#include <string>

#include "arbory/options.h"
#include "arbory/rows.h"
#include "nas/results/result_reader.h"

namespace arbory {

class RowReader {
 public:
  // Reads the rows that `options` asks for; in the order of a column only where all have been
  // found. Borrows both. The file is one that a user can write to: the process must be that user
  // for good. Throws what ResultReader does.
  RowReader(const std::string& path, const SearchOptions& options, const RowFormat& format);

  struct Rows {
    std::uint64_t count = 0;
    std::string text;
    bool caught_up = false;  // no more were there
  };
  // The next rows that are there. Throws what ResultReader does.
  Rows Next();
  // Whether all rows have been read that were asked for.
  bool AtEnd() const { return at_ == end_; }

 private:
  void Sort();

  const SearchOptions& options_;
  nas::ResultReader reader_;
  const bool counts_only_;
  RowWriter writer_;
  std::vector<std::uint32_t> sorted_;
  std::uint64_t at_;   // the next row
  std::uint64_t end_;  // the row after the last one wanted
};

}  // namespace arbory
