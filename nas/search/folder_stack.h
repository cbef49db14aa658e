#pragma once
// The folders that wait to be read. Each thread of a walk has a stack of its own, so that threads
// hardly ever meet; one whose stack is empty takes from another's bottom, where the largest
// subtrees lie.
//
// What waits is kept as one batch for each folder that has sub-folders: their names end to end, and
// one descriptor of the folder itself by which they are opened. So memory is that of the names, and
// descriptors are as many as the tree is deep, times the threads: the newest batch is taken first.

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

#include "nas/base/unique_fd.h"
#include "nas/search/ignore_files.h"

namespace nas {

// Sub-folders of one folder.
struct FolderBatch {
  UniqueFd parent;
  std::uint16_t location = 0;
  std::string parent_path;   // below the share's root
  IgnoreFiles::Ptr ignores;  // of the parent, or those above it where a walk begins
  std::string names;         // NUL-ended; "." is the parent itself, where a walk begins
};

class FolderStack {
 public:
  static constexpr size_t kMostThreads = 16;

  struct Item {
    std::shared_ptr<FolderBatch> batch;
    std::string_view name;  // into batch->names, NUL-ended
  };

  // `thread`, here and below: the number of the calling thread, less than kMostThreads.
  void Push(size_t thread, std::shared_ptr<FolderBatch> batch);
  // Waits for a folder to read. False once none waits and every thread that could find more has
  // come back here, or after Abort. A thread asks again only when it is done with its last item.
  bool Take(size_t thread, Item& item);
  // While anybody holds it, no Take ends for want of folders: some may still be pushed.
  void Hold() { ++unfinished_; }
  void Release() {
    if (--unfinished_ == 0) WakeAll();
  }
  // Makes every Take return false at once.
  void Abort();

 private:
  struct Waiting {
    std::shared_ptr<FolderBatch> batch;
    size_t next = 0;
  };
  static constexpr size_t kCacheLine = 64;
  struct alignas(kCacheLine) Own {
    std::mutex mutex;  // guards waiting
    std::deque<Waiting> waiting;
  };
  enum class End { kOldest, kNewest };

  static bool TakeFrom(Own& own, End end, Item& item);
  void WakeAll();

  std::array<Own, kMostThreads> own_;
  std::atomic<size_t> unfinished_ = 0;  // folders pushed and not yet done with, and holders
  std::atomic<bool> aborted_ = false;
  std::atomic<int> changes_ = 0;  // what threads without work wait on
};

}  // namespace nas
