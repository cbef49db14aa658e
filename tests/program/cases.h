#pragma once
// One table of searches for every way of searching, and the one body that compares what a way finds
// with the naive walk.

#include <json/value.h>

#include <functional>
#include <string>
#include <vector>

#include "tests/program/reference.h"

namespace program_test {

struct Case {
  const char* why;
  const char* params;  // of "start", without "folder_path"
  std::function<bool(const Entry&)> wanted;
};

const std::vector<Case>& Cases();

struct Found {
  std::vector<std::string> paths;  // each as often as it was found
  size_t unreadable = 0;           // folders
  bool cleaned = false;            // whether bytes that are no UTF-8 became U+FFFD
  bool refused = false;            // as a search that can find nothing
};
// Searches the folder; `params` hold "recursive" and "search_content" in every case.
using Way = std::function<Found(const Json::Value& params, const std::string& folder)>;

void Compare(const Case& row, const std::string& folder, const Way& way);
void CompareAll(const std::string& folder, const Way& way);

}  // namespace program_test
