#pragma once
// Events of single folders, by inotify(7), for a daemon without root: names alone. What changes a
// file's attributes by a link or a mapping elsewhere nobody tells it, so it does not pretend to
// know attributes.
//
// Whoever reads a folder watches it first, in the process that makes a table, which inherits the
// queue; the numbers that the kernel gave come back with the table (Adopt). Watches are a budget
// that all programs of a user share, so only a part of it is taken; folders beyond it are left out.

#include <atomic>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "nas/base/unique_fd.h"
#include "nas/index/event_source.h"
#include "nas/index/name_table.h"

namespace nas {

class InotifySource : public EventSource {
 public:
  // Fails where the user has no room for another queue.
  static Result<std::unique_ptr<InotifySource>> Make();

  int fd() const override { return queue_.get(); }
  size_t Waiting() const override;
  size_t Take(size_t much, EventSink& sink) override;
  bool TellsAttributes() const override { return false; }

  // Watches the folder open at `folder_fd`. The number of the watch, or -1 where it cannot be or
  // the part is used up. Any thread, and any process that inherited the queue.
  int Watch(int folder_fd);
  // The number of a watch, and the folder it is on.
  using Watches = std::unordered_map<int, FolderKey>;
  // From now on these are told too, and at once what has come of them already.
  void Adopt(Watches watches, EventSink& sink);
  // Ends the watches on folders that the table does not have.
  void Forget(const NameTable& table);

  size_t watches() const { return watches_.size(); }

 private:
  InotifySource(UniqueFd queue, int budget);
  void TellOne(int watch, std::uint32_t mask, std::string_view name, EventSink& sink);

  UniqueFd queue_;
  int budget_;
  std::atomic<int> left_;  // of the budget, in the process that watches
  Watches watches_;
  // Events of watches that are not known here yet: set by a process that still makes a table.
  struct Early {
    int watch = -1;
    std::uint32_t mask = 0;
    std::string name;
  };
  std::vector<Early> early_;
};

}  // namespace nas
