#pragma once
// Which folders a search enters.
//
// Symbolic links are results, never followed. A folder on another file system is entered unless it
// is a pseudo file system (proc, sysfs and their like) below a location; the temporary folders
// "@tmp" of volumes are never entered. A location inside another is entered as a location only, so
// that its files are found once. What the search's own terms leave out stands in pruning.h.

#include <dirent.h>
#include <sys/types.h>

#include <set>
#include <utility>
#include <vector>

#include "nas/base/unique_fd.h"
#include "nas/search/ignore_files.h"
#include "nas/search/location.h"
#include "nas/search/pruning.h"
#include "nas/search/refusal.h"

namespace nas {

// Does not change once made: any thread may ask.
class FolderGate {
 public:
  using FolderIds = std::set<std::pair<dev_t, ino_t>>;
  struct Rules {
    bool recursive = true;
    bool crosses_mounts = true;  // otherwise what is mounted below a location is left to another
    FolderIds temporary = {};    // the @tmp folders of volumes
    FolderIds locations = {};    // filled when there is more than one
  };
  // Looks where the volumes' temporary folders are.
  static Rules RulesFor(const std::vector<Location>& locations, bool recursive);

  FolderGate(const std::vector<Location>& locations, bool recursive, Pruning pruning)
      : FolderGate(RulesFor(locations, recursive), std::move(pruning)) {}
  FolderGate(Rules rules, Pruning pruning)
      : rules_(std::move(rules)), pruning_(std::move(pruning)), prunes_(pruning_.by_names()) {}

  const Rules& rules() const { return rules_; }

  // Whether an entry of this type (DT_*), `name` in the folder at `parent` of that location, is a
  // folder whose own entries are searched too; kNone, or why not. Says nothing yet of that very
  // folder: Open does.
  Refusal Below(unsigned char type, const Location& location, std::string_view parent,
                std::string_view name, const IgnoreFiles* ignores) const {
    if (type != DT_DIR) return type == DT_LNK ? Refusal::kSymbolicLink : Refusal::kNoFolder;
    if (!rules_.recursive) return Refusal::kNotRecursive;
    if (ignores != nullptr && ignores->LeaveOut(parent, name, true)) return Refusal::kFolderIgnored;
    return prunes_ ? pruning_.MayEnter(location.path, parent, name) : Refusal::kNone;
  }
  // The ignore files above a location, and with those of a folder on the way; null where they are
  // not to be obeyed.
  IgnoreFiles::Ptr IgnoresAbove(const Location& location) const {
    return pruning_.ignores ? IgnoreFiles::Above(location) : nullptr;
  }
  IgnoreFiles::Ptr IgnoresOf(int fd, std::string_view path, const IgnoreFiles::Ptr& above) const {
    return pruning_.ignores ? IgnoreFiles::Of(fd, path, above) : nullptr;
  }

  // The folder to read, or why it is left out: with kFolderUnreadable errno says more.
  struct Opened {
    UniqueFd fd;
    Refusal refusal = Refusal::kNone;
    int error_number = 0;
  };
  // `name` (NUL-ended) in the folder open at `parent`; "." is `parent` itself, a location.
  Opened Open(int parent, const char* name) const;

 private:
  Refusal MayEnter(int parent, int fd, std::string_view name, bool crossed) const;

  const Rules rules_;
  const Pruning pruning_;
  const bool prunes_;
};

}  // namespace nas
