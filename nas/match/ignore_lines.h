#pragma once
// The lines of one .gitignore, by the rules of gitignore(5), and of files of the same form. Names
// are compared as they are, letter case counts. Does not change once made: any thread may ask.
//
//   # ...      a remark; "\#" begins a name, and "\" takes any other sign as it is
//   name       what has that name, anywhere below; "*", "?" and sets in it speak
//   a/b, /a    that path from the folder that the file lies in; "**" is any folders
//   name/      folders alone
//   !name      is kept, where lines before it say otherwise: the last that fits decides

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/wildcards.h"

namespace nas {

class IgnoreLines {
 public:
  IgnoreLines() = default;
  explicit IgnoreLines(std::string_view text);

  enum class Verdict { kNothing, kIgnored, kKept };
  // `path`: below the folder that the file lies in, no "/" at its ends.
  Verdict Of(std::string_view path, bool is_folder) const;
  bool empty() const { return lines_.empty(); }

 private:
  struct Line {
    std::string name;  // where nothing speaks
    std::optional<Wildcards> wildcards;
    bool of_path = false;  // begins with "/" then
    bool folders_only = false;
    bool keeps = false;
  };
  void Add(std::string_view text);

  std::vector<Line> lines_;
};

}  // namespace nas
