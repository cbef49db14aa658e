#pragma once
// The rows of a search as paths.

#include <cstring>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "nas/results/row_sink.h"
#include "tests/program/program_test.h"

namespace program_test {

// Rows as a search hands them over, without a result database.
class KeptRows : public nas::RowSink {
 public:
  explicit KeptRows(std::string root) : root_(std::move(root)) {}

  void Append(nas::RowBlock& block) override {
    const std::lock_guard lock(mutex_);
    std::vector<std::string> folders;
    for (std::string_view rest = block.folders(); !rest.empty();) {
      rest.remove_prefix(sizeof(std::uint16_t));
      folders.emplace_back(rest.data());
      rest.remove_prefix(folders.back().size() + 1);
    }
    nas::FileAttributes file;
    size_t row = 0;
    for (const std::string& name : Pieces(std::string(block.names()), '\0')) {
      std::memcpy(&file, block.attributes().data() + sizeof(file) * row++, sizeof(file));
      const std::string& folder = folders.at(file.folder);
      paths_.push_back(root_ + (folder.empty() ? "" : "/" + folder) + "/" + name);
    }
    block.Clear();
  }
  const std::vector<std::string>& paths() const { return paths_; }

 private:
  const std::string root_;
  std::mutex mutex_;  // guards paths_
  std::vector<std::string> paths_;
};

}  // namespace program_test
