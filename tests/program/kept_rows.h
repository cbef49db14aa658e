#pragma once
// Searches by the engine itself, whose rows are kept as paths.

#include <cstring>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "arbory/comparators.h"
#include "nas/results/row_sink.h"
#include "nas/search/content_reading.h"
#include "nas/search/search_job.h"
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

// A search by the engine itself, set up as a worker does; `folder` lies in the share whose root is
// `share`.
struct EngineSearch {
  EngineSearch(const Json::Value& params, const std::string& share, const std::string& folder,
               const std::string& temporary_folder)
      : comparators(params), rows(share), search(comparators.get(), rows, never) {
    locations.push_back(std::move(*nas::OpenLocation("/share" + folder.substr(share.size()))));
    search.SearchContents(temporary_folder, params["search_content"].asBool());
  }
  // To its end.
  void Run(nas::NameSource& names) {
    nas::ContentReading contents(locations, search);
    nas::SearchJob job(search, {.report = [](const nas::WalkProgress&) {}, .stuck = {}});
    EXPECT_TRUE(job.Run(names, contents));
  }

  std::vector<nas::Location> locations;
  const arbory::Comparators comparators;
  KeptRows rows;
  const int never = 0;
  nas::SharedSearch search;
};

}  // namespace program_test
