#pragma once
// What the ignore files of a tree leave out (the term "ignored:no"): the .gitignore files of a
// repository from its top down, with its .git/info/exclude, and the files .ignore and .fdignore,
// which speak anywhere. What .fdignore says comes before .ignore, and that before git's; of one
// kind the file nearest to the entry comes first. What is in a folder that is left out is left out
// with it. Files above the searched folder count up to the top of its share, never beyond.
//
// Read when a folder is entered, under the identity of the process; a file that cannot be read, is
// no regular one or is larger than kMostBytes says nothing.

#include <memory>
#include <string>
#include <string_view>

#include "nas/match/ignore_lines.h"
#include "nas/search/location.h"

namespace nas {

// Of one folder and those above it. Does not change once made: any thread may ask.
class IgnoreFiles {
 public:
  static constexpr size_t kMostBytes = size_t{1} << 20;
  // Null where there are none.
  using Ptr = std::shared_ptr<const IgnoreFiles>;

  // Those above a location.
  static Ptr Above(const Location& location);
  // Of the folder open at `fd` (O_PATH will do) at `path` below the share's root, and those above.
  static Ptr Of(int fd, std::string_view path, const Ptr& above);

  // Whether `name` in the folder at `folder`, the one that this was made of or one below it whose
  // own files add nothing, is left out.
  bool LeaveOut(std::string_view folder, std::string_view name, bool is_folder) const;

 private:
  using Verdict = IgnoreLines::Verdict;
  enum Kind { kFd, kPlain, kGit, kKinds };

  Verdict OfKind(Kind kind, std::string_view path, bool is_folder) const;
  Verdict OfGit(std::string_view path, bool is_folder) const;
  std::string_view Below(std::string_view path) const {
    return path.substr(path_.empty() ? 0 : path_.size() + 1);
  }

  Ptr above_;
  std::string path_;
  IgnoreLines lines_[kKinds];
  IgnoreLines exclude_;  // of .git/info
  bool is_repository_ = false;
};

}  // namespace nas
