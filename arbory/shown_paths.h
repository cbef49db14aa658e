#pragma once
// How paths are shown: beginning with the folder to search as it was named, as a person who stands
// where the program was started can go on with them.

#include <string>
#include <string_view>
#include <vector>

namespace arbory {

class ShownPaths {
 public:
  // All as they are on disk.
  ShownPaths() = default;
  // What lies below one of `folders` is shown below it as it is written there, "" being the current
  // folder shown as nothing at all. Folders that cannot be looked at, and what lies elsewhere, are
  // shown as they are on disk.
  explicit ShownPaths(const std::vector<std::string>& folders);

  // What lies below `real_path` is shown below `shown`, which ends with "/".
  void Show(const std::string& real_path, const std::string& shown) {
    roots_.push_back({real_path, shown});
  }

  // Appends what stands before the names of what lies in the folder at `real_path` (empty: the root
  // directory).
  void AppendFolder(const std::string& real_path, std::string* out) const;

 private:
  struct Root {
    std::string real;   // without a final "/"
    std::string shown;  // with one where it is not empty
  };
  std::vector<Root> roots_;
};

}  // namespace arbory
