#pragma once
// A search as it is seen from outside the module, running or ended: what its task record says. The
// record is read under the identity the process has, which must be the user's: the record lies in
// a folder of the user's own, and what it names is of the user's choosing.

#include <json/value.h>

#include <cstdint>
#include <string>
#include <vector>

#include "nas/base/unique_fd.h"

namespace arbory {

// Values of a wrong type read as absent ones: a record is no better than its last writer.
struct RunningSearch {
  bool exists = false;  // false: cleaned, or never there; the rest is as it stands here then
  bool finished = false;
  int progress = 0;  // 1: complete, -1: failed with `error`, 0: running, or ended before its end
  int error = 0;     // web API code
  int pid = 0;       // of the worker, which may have ended
  // Path of the result file, empty until there is one. Nobody has looked there.
  std::string results;
  Json::Value location;  // the folders, as they were normalised at the start

  Json::Value walk;  // as the walk reports it to clients, null until it has begun; below, its parts
  bool all_found = false;  // no more rows will come
  bool reads_contents = false;
  std::uint64_t content_files = 0;  // read so far, of so many, and the one begun last
  std::uint64_t content_of = 0;
  std::uint64_t content_bytes = 0;
  std::string content_path;
  struct Unread {
    std::string path;
    int error_number = 0;
  };
  std::vector<Unread> unread_folders;  // the first, where they were asked for
  std::uint64_t folders = 0;
  std::uint64_t entries = 0;
  std::uint64_t matches = 0;
  std::uint64_t unreadable = 0;  // folders skipped for lack of permission
  std::uint64_t troubled = 0;  // folders skipped for other reasons; those that vanished not counted
  std::uint64_t unreadable_files = 0;
  // Where names came from ("index", "walk", "both") and why so, as platform/task_record.h has it;
  // empty until that is known.
  std::string source;
  std::string index;
  std::uint64_t not_text = 0;  // files whose contents were not looked into
};

// Throws nothing: a record that cannot be read is that of a search that does not exist.
RunningSearch ReadSearch(const std::string& user, const std::string& task_id);

// Waits until the search has rows to show or nobody works on it any more, for so many tenths of a
// second at most. Reads the results: the process must be the user for good.
void WaitForFirstRows(const std::string& user, const std::string& task_id, int tenths);

// Tells the search that its results are wanted, for as long as the descriptor is open. Invalid
// where that cannot be had: then only looking at it does.
nas::UniqueFd AskAfter(const std::string& user, const std::string& task_id);

// The ids of the user's searches that have not finished; none where they cannot be looked up.
std::vector<std::string> UnfinishedSearches(const std::string& user);

}  // namespace arbory
