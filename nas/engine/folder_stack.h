#pragma once
// The folders that wait to be read, shared by the threads of a walk.
//
// What waits is kept as one batch for each folder that has sub-folders: their names end to end, and
// one descriptor of the folder itself by which they are opened. So memory is that of the names, and
// descriptors are as many as the tree is deep, times the threads: the newest batch is taken first.

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "nas/system/unique_fd.h"

namespace nas {

// Sub-folders of one folder.
struct FolderBatch {
  UniqueFd parent;
  std::uint16_t location = 0;
  std::string parent_path;  // below the share's root
  std::string names;        // NUL-ended; "." is the parent itself, where a walk begins
};

class FolderStack {
 public:
  struct Item {
    std::shared_ptr<FolderBatch> batch;
    std::string_view name;  // into batch->names, NUL-ended
  };

  void Push(std::shared_ptr<FolderBatch> batch);
  // Waits for a folder to read. False once none waits and every thread that could find more has
  // come back here, or after Abort. A thread asks again only when it is done with its last item.
  bool Take(Item& item);
  // Makes every Take return false at once.
  void Abort();

 private:
  struct Waiting {
    std::shared_ptr<FolderBatch> batch;
    size_t next = 0;
  };

  std::mutex mutex_;  // guards everything below
  std::condition_variable changed_;
  std::vector<Waiting> waiting_;
  int busy_ = 0;  // items taken and not yet done with
  bool aborted_ = false;
};

}  // namespace nas
