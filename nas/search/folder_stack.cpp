#include "nas/search/folder_stack.h"

#include <algorithm>

namespace nas {

void FolderStack::Push(size_t thread, std::shared_ptr<FolderBatch> batch) {
  const auto folders = static_cast<size_t>(std::ranges::count(batch->names, '\0'));
  unfinished_ += folders;
  Own& own = own_[thread];
  bool enough_for_others = folders > 1;
  {
    const std::lock_guard lock(own.mutex);
    own.waiting.push_back({std::move(batch), 0});
    enough_for_others |= own.waiting.size() > 1;
  }
  // A single folder is taken next by this thread itself.
  if (enough_for_others) WakeAll();
}

bool FolderStack::Take(size_t thread, Item& item) {
  if (item.batch) {
    item = {};
    if (--unfinished_ == 0) WakeAll();
  }
  while (true) {
    const int seen = changes_;
    if (aborted_) return false;
    if (TakeFrom(own_[thread], End::kNewest, item)) return true;
    for (size_t step = 1; step < kMostThreads; ++step) {
      if (TakeFrom(own_[(thread + step) % kMostThreads], End::kOldest, item)) return true;
    }
    if (unfinished_ == 0) return false;
    changes_.wait(seen);
  }
}

bool FolderStack::TakeFrom(Own& own, End end, Item& item) {
  const std::lock_guard lock(own.mutex);
  if (own.waiting.empty()) return false;
  Waiting& chosen = end == End::kNewest ? own.waiting.back() : own.waiting.front();
  item.batch = chosen.batch;
  item.name = item.batch->names.c_str() + chosen.next;
  chosen.next += item.name.size() + 1;
  if (chosen.next < item.batch->names.size()) return true;
  if (end == End::kNewest) {
    own.waiting.pop_back();
  } else {
    own.waiting.pop_front();
  }
  return true;
}

void FolderStack::Abort() {
  aborted_ = true;
  WakeAll();
}

void FolderStack::WakeAll() {
  ++changes_;
  changes_.notify_all();
}

}  // namespace nas
