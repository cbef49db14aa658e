#include "nas/engine/folder_stack.h"

namespace nas {

void FolderStack::Push(std::shared_ptr<FolderBatch> batch) {
  const std::lock_guard lock(mutex_);
  waiting_.push_back({std::move(batch), 0});
  changed_.notify_all();
}

bool FolderStack::Take(Item& item) {
  std::unique_lock lock(mutex_);
  if (item.batch) {
    --busy_;
    // The descriptor of an exhausted batch is closed outside the lock, by whoever lets go last.
    const std::shared_ptr<FolderBatch> done = std::move(item.batch);
    lock.unlock();
    item = {};
    lock.lock();
  }
  changed_.wait(lock, [this] { return aborted_ || !waiting_.empty() || busy_ == 0; });
  if (aborted_ || waiting_.empty()) {
    changed_.notify_all();
    return false;
  }
  Waiting& top = waiting_.back();
  item.batch = top.batch;
  item.name = item.batch->names.c_str() + top.next;
  top.next += item.name.size() + 1;
  if (top.next >= item.batch->names.size()) waiting_.pop_back();
  ++busy_;
  return true;
}

void FolderStack::Abort() {
  const std::lock_guard lock(mutex_);
  aborted_ = true;
  changed_.notify_all();
}

}  // namespace nas
