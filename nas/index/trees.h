#pragma once
// The trees of one file system that are indexed, opened, and the source of its events.

#include <memory>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"
#include "nas/index/event_source.h"
#include "nas/index/inotify_source.h"

namespace nas {

// One file system, as the broker has found it (index_plan.h).
struct FileSystem {
  std::string id;                    // what its table is kept under; the same after each mount
  bool keeps = true;                 // whether what is kept of it is of use after a restart
  std::string type;                  // as the kernel calls it
  std::string source;                // the device, as mounted
  std::string device;                // "MAJOR:MINOR" of the mounted whole
  std::vector<std::string> numbers;  // the same of its trees, where subvolumes have their own
  std::vector<std::string> trees;    // absolute paths; none lies in another
  bool operator==(const FileSystem&) const = default;
};

class Trees {
 public:
  // Opens the trees and asks for their events. Where the process may, each tree is seen through a
  // private clone of its mount, so that nothing mounted in it hides what is below. Without the
  // right to hear of the whole file system, single folders are watched.
  static Result<Trees> Open(const FileSystem& file_system, bool writes);

  struct Tree {
    std::string path;
    UniqueFd folder;
  };
  const std::vector<Tree>& trees() const { return trees_; }
  EventSource& events() const { return *source_; }
  // Null where the whole file system is watched.
  InotifySource* by_folder() const { return by_folder_; }

 private:
  std::vector<Tree> trees_;
  UniqueFd top_;  // of a file system with subvolumes
  std::unique_ptr<EventSource> source_;
  InotifySource* by_folder_ = nullptr;
};

}  // namespace nas
