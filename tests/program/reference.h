#pragma once
// A naive walk to compare searches with: readdir and lstat, one folder after the other, nothing
// shared with the engine.

#include <sys/stat.h>

#include <functional>
#include <set>
#include <string>

namespace program_test {

struct Entry {
  std::string path;
  std::string name;
  struct stat info;
  bool is_dir() const { return S_ISDIR(info.st_mode); }
};

struct Reference {
  std::set<std::string> paths;
  size_t unreadable = 0;  // folders
};

// What lies below `folder` and passes `wanted`, not following symbolic links.
Reference Walk(const std::string& folder, bool recursive,
               const std::function<bool(const Entry&)>& wanted);

// The whole content of a regular file that holds no NUL; empty for any other.
std::string TextOf(const std::string& path);

// A folder that holds what is hard to get right: names of every kind, sizes and times at the edges
// of the criteria, links in circles, special files. Times of modification count up from kFirstTime,
// one second a file.
inline constexpr long kFirstTime = 1'700'000'000;
void MakeHostileTree(const std::string& root);

}  // namespace program_test
