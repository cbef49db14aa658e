#pragma once
// The blocks of a result file (result_file.h), taken apart: a row by its number, or one side of all
// rows in order.

#include <cstdint>
#include <cstring>
#include <map>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/sqlite.h"
#include "nas/results/result_file.h"
#include "nas/results/row_block.h"

namespace nas {

// The file is its user's own to write to, while the process that reads it may be able to become
// root: numbers in it are checked before anything is indexed by them or memory is taken for them.
inline void CheckResultFile(bool sound) {
  if (!sound) throw std::runtime_error("a damaged result file");
}

// One row, valid until the reader is asked for another.
struct ResultRow {
  std::string_view share_name;
  std::string_view share_root;
  std::string_view folder;  // below the share's root; empty for the root itself
  std::string_view name;
  const FileAttributes* attributes = nullptr;
};

// Belongs to one thread. What reads throws SqliteError where the file cannot be read, and
// std::runtime_error or std::out_of_range where it is damaged. Whatever a file claims, no more is
// read of it than it is long, and memory is a small multiple of that.
class BlockReader {
 public:
  struct Location {
    std::string share_name;
    std::string share_root;
  };
  struct Folder {
    std::uint16_t location;
    std::string_view path;  // below the share's root
  };
  // The names side of a block, taken apart. Views point into its own bytes.
  struct Names {
    std::string bytes;
    std::vector<Folder> folders;
    std::vector<std::string_view> names;  // those asked for so far
    size_t rest = 0;                      // where in `bytes` the others begin
  };

  // Borrows both; `path` is the database's.
  BlockReader(Database& db, const std::string& path) : db_(db), path_(path) {}

  // Looks what there is. Everything below is allowed between Open and Close, inside one transaction
  // of the database.
  void Open();
  // Lets go of the transaction; harmless where nothing is open.
  void Close() { attributes_.reset(); }

  // How many rows there are, purged ones included.
  std::uint64_t rows() const { return rows_; }
  const Location& location(std::uint16_t id) const { return locations_.at(id); }
  ResultRow Row(std::uint32_t number);

  // Calls visit(first row, names side of the block) for every block, in order. The blocks number
  // the rows without a gap.
  template <typename Visitor>
  void ForEachNames(Visitor visit);
  // Calls visit(row, attributes) for every row, in order and without a gap.
  template <typename Visitor>
  void ForEachAttributes(Visitor visit);

 private:
  // The attributes are read in pieces of kPieceRows rows, each when one of its rows is asked for: a
  // short page needs few of a block's, and to copy them all would be most of its making.
  struct Block {
    Names names;
    size_t rows = 0;
    std::map<size_t, std::vector<FileAttributes>> pieces;  // by first row in the block
  };

  // What one pass over the file may read. Parts of a damaged file can lie in the same place, so
  // that together they seem longer than the file.
  class Budget {
   public:
    explicit Budget(std::uint64_t bytes) : left_(bytes) {}
    void Spend(std::string_view bytes) {
      CheckResultFile(bytes.size() <= left_);
      left_ -= bytes.size();
    }

   private:
    std::uint64_t left_;
  };

  std::uint64_t ReadRowCount();
  void ReadLocations();
  static void TakeApart(std::string_view folders, std::string_view names, Names& out);
  static void ParseNames(Names& names, size_t count);
  Block& BlockOf(std::uint32_t number, std::uint64_t& first);
  void OpenAttributes(std::int64_t first);
  const FileAttributes& AttributesIn(Block& block, std::uint64_t first, size_t index);

  Database& db_;
  const std::string& path_;
  std::uint64_t file_bytes_ = 0;  // its log included
  std::uint64_t rows_ = 0;
  std::map<std::uint16_t, Location> locations_;
  std::map<std::uint64_t, Block> blocks_;  // by first row
  size_t held_bytes_ = 0;                  // of the names in them
  // Of the block read last. It holds the database's transaction.
  std::optional<Blob> attributes_;
  std::int64_t attributes_of_ = 0;
};

template <typename Visitor>
void BlockReader::ForEachNames(Visitor visit) {
  std::uint64_t next = 0;
  Budget budget(file_bytes_);
  Statement blocks(db_, "SELECT first, folders, names FROM names ORDER BY first");
  Names names;
  while (blocks.Step()) {
    names.folders.clear();
    names.names.clear();
    budget.Spend(blocks.Bytes(1));
    budget.Spend(blocks.Bytes(2));
    TakeApart(blocks.Bytes(1), blocks.Bytes(2), names);
    ParseNames(names, RowBlock::kMostRows);
    CheckResultFile(static_cast<std::uint64_t>(blocks.Integer(0)) == next &&
                    names.rest >= names.bytes.size() && !names.names.empty() &&
                    names.folders.size() <= names.names.size() &&
                    names.names.size() <= rows_ - next);
    visit(next, names);
    next += names.names.size();
  }
  CheckResultFile(next == rows_);
}

template <typename Visitor>
void BlockReader::ForEachAttributes(Visitor visit) {
  Statement blocks(db_, "SELECT first, data FROM attributes ORDER BY first");
  FileAttributes row;
  std::uint64_t next = 0;
  Budget budget(file_bytes_);
  while (blocks.Step()) {
    const std::string_view data = blocks.Bytes(1);
    budget.Spend(data);
    CheckResultFile(static_cast<std::uint64_t>(blocks.Integer(0)) == next &&
                    data.size() >= sizeof(row) && data.size() / sizeof(row) <= rows_ - next);
    for (size_t at = 0; at + sizeof(row) <= data.size(); at += sizeof(row)) {
      std::memcpy(&row, data.data() + at, sizeof(row));
      visit(static_cast<std::uint32_t>(next++), row);
    }
  }
  CheckResultFile(next == rows_);
}

}  // namespace nas
