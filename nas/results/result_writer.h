#pragma once
// The writing end of a result database: made by the worker, fed with blocks by its threads.

#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "nas/base/sqlite.h"
#include "nas/results/row_sink.h"

namespace nas {

class ResultWriter : public RowSink {
 public:
  // Makes the file, which must not exist or be empty. Throws SqliteError.
  explicit ResultWriter(const std::string& path);

  // Registers where rows lie; to be called before any block that names it, with the next of which
  // it is written.
  void AddLocation(std::uint16_t id, const std::string& share_name, const std::string& share_root);
  // Names an account of another machine (foreign_accounts.h). Throws SqliteError.
  void AddAccount(std::uint32_t id, const std::string& name);
  // The rows are visible to listings at once. Throws SqliteError.
  void Append(RowBlock& block) override;
  // Says that no rows will follow, so that orderings are worth keeping. Throws SqliteError.
  void Complete();
  // Of the file, which closing would do while nobody else can open it (sqlite.h). It waits for no
  // one.
  void EmptyLog();
  std::uint64_t rows();

 private:
  struct Location {
    std::uint16_t id;
    std::string share_name;
    std::string share_root;
  };

  void WriteLocations();

  std::mutex mutex_;  // guards everything below
  Database db_;
  std::vector<Location> locations_;  // not yet written
  Statement insert_location_;
  Statement insert_names_;
  Statement insert_attributes_;
  std::uint64_t rows_ = 0;
};

}  // namespace nas
