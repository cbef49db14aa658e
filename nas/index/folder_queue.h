#pragma once
// The folders that wait for one of several threads. What waits is kept as one batch for each folder
// that has sub-folders, with one descriptor of that folder, by which they are opened; the newest
// batch is taken first. So descriptors are as many as the tree is deep; very deep trees would need
// more than a process may have, and beyond kMostHeld a batch has none: the path is gone down again.

#include <algorithm>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>
#include <utility>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"

namespace nas {

template <typename Folder>
class FolderQueue {
 public:
  static constexpr size_t kMostHeld = 256;

  struct Batch {
    std::shared_ptr<UniqueFd> parent;
    std::vector<Folder> folders;
  };
  struct Task {
    std::shared_ptr<UniqueFd> parent;
    Folder folder;
  };

  // Any thread, here and below. Before Run, or by one that is at a task.
  void Push(UniqueFd parent, std::vector<Folder> folders) {
    if (folders.empty()) return;
    Batch batch;
    const std::lock_guard lock(mutex_);
    if (parent && held_ < kMostHeld) {
      batch.parent = std::make_shared<UniqueFd>(std::move(parent));
      ++held_;
    }
    unfinished_ += folders.size();
    // Taken from the end.
    std::reverse(folders.begin(), folders.end());
    batch.folders = std::move(folders);
    waiting_.push_back(std::move(batch));
    changed_.notify_all();
  }

  // Ends all threads soon, and Run with this error.
  void Fail(Error error) {
    const std::lock_guard lock(mutex_);
    if (!failed_) failed_ = std::move(error);
    changed_.notify_all();
  }

  // Has so many threads run `work`, which is given what makes the next task, until none waits.
  using Take = std::function<bool(Task& task)>;
  Status Run(unsigned threads, const std::function<void(unsigned number, const Take& take)>& work) {
    std::vector<std::thread> running;
    for (unsigned i = 0; i < threads; ++i) {
      running.emplace_back([this, &work, i] {
        bool busy = false;
        work(i, [this, &busy](Task& task) { return Next(task, busy); });
      });
    }
    for (std::thread& thread : running) thread.join();
    return failed_ ? Status(*failed_) : Status();
  }

 private:
  bool Next(Task& task, bool& busy) {
    task = {};
    std::unique_lock lock(mutex_);
    if (std::exchange(busy, false) && --unfinished_ == 0) changed_.notify_all();
    changed_.wait(lock, [this] { return !waiting_.empty() || unfinished_ == 0 || failed_; });
    if (waiting_.empty() || failed_) return false;
    Batch& batch = waiting_.back();
    task = {batch.parent, std::move(batch.folders.back())};
    batch.folders.pop_back();
    if (batch.folders.empty()) {
      if (batch.parent) --held_;
      waiting_.pop_back();
    }
    return busy = true;
  }

  std::mutex mutex_;  // guards what follows
  std::condition_variable changed_;
  std::vector<Batch> waiting_;
  size_t held_ = 0;        // descriptors of those waiting
  size_t unfinished_ = 0;  // folders waiting or being worked at
  std::optional<Error> failed_;
};

}  // namespace nas
