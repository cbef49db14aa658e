#pragma once
// Which folders a search could not read, and why, for those who ask for more than the count.

#include <cstddef>
#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

namespace nas {

class UnreadSink {
 public:
  virtual ~UnreadSink() = default;
  // `path`: below the root of the share of that location. Callable from any thread.
  virtual void AddUnread(int error_number, std::uint16_t location, std::string_view path) = 0;
};

// The first of them; a search's record is no place for very many.
class UnreadFolders : public UnreadSink {
 public:
  static constexpr size_t kMost = 1000;
  struct Folder {
    int error_number = 0;
    std::uint16_t location = 0;
    std::string path;
  };
  void AddUnread(int error_number, std::uint16_t location, std::string_view path) override {
    const std::lock_guard lock(mutex_);
    if (folders_.size() < kMost) folders_.push_back({error_number, location, std::string(path)});
  }
  std::vector<Folder> folders() const {
    const std::lock_guard lock(mutex_);
    return folders_;
  }

 private:
  mutable std::mutex mutex_;  // guards folders_
  std::vector<Folder> folders_;
};

}  // namespace nas
