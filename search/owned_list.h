#pragma once
// Owner of a list of comparators whose elements are raw pointers because the platform takes them
// so. Deletes them in list order, also when an exception passes.

#include <memory>
#include <utility>
#include <vector>

template <class T>
class OwnedList {
 public:
  OwnedList() = default;
  OwnedList(const OwnedList&) = delete;
  OwnedList& operator=(const OwnedList&) = delete;
  ~OwnedList() {
    for (T* item : items_) delete item;
  }

  std::vector<T*>& items() { return items_; }

 private:
  std::vector<T*> items_;
};

// Appends to a list that its owner deletes.
template <class T, class U>
void AppendOwned(std::vector<T*>& items, std::unique_ptr<U> item) {
  items.push_back(item.get());
  (void)item.release();
}
