#pragma once
// Reads a search's rows page by page. Once all are found they are asked for ahead, a page for each
// core, because making a page takes longer than printing it.

#include <cstdint>
#include <deque>
#include <functional>
#include <string>

#include "arbory/caller.h"
#include "arbory/options.h"
#include "arbory/rows.h"

namespace arbory {

class PageReader {
 public:
  // Reads the rows that `options` asks for, in its order. All but `options` is borrowed.
  PageReader(Caller* caller, const SearchOptions& options, const RowFormat& format,
             const std::string& task_id);
  ~PageReader();
  PageReader(const PageReader&) = delete;
  PageReader& operator=(const PageReader&) = delete;

  // Whether all rows have been read that were asked for.
  bool AtEnd() const { return at_ == end_; }
  // The next page; one that holds less than it could is followed by what is found later. `go_on` is
  // asked now and then while it is waited for; when it answers false the page is an error.
  // `all_found`: no more rows will come.
  Page Next(bool all_found, const std::function<bool()>& go_on);
  // Whether the last page held all the rows there were.
  bool caught_up() const { return caught_up_; }

 private:
  struct Asked {
    nas::Child call;
    std::uint64_t rows = 0;
  };

  void Ask();
  void Forget();
  Page Take(const std::function<bool()>& go_on);

  Caller& caller_;
  const nas::ReplyEncoder encode_;
  Json::Value params_;
  std::uint64_t at_;    // the first row of the next page
  std::uint64_t end_;   // the row after the last one wanted
  std::uint64_t next_;  // the first row not yet asked for
  std::deque<Asked> asked_;
  std::uint64_t wanted_ = 0;  // rows of the last page, had there been enough
  std::uint64_t total_ = 0;   // as of the last page
  bool caught_up_ = false;
};

}  // namespace arbory
