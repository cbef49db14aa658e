#include "nas/index/inotify_source.h"

#include <sys/inotify.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <fstream>
#include <utility>

#include "nas/base/system_call.h"

namespace nas {
namespace {

constexpr size_t kBufferBytes = size_t{64} << 10;
// What is kept of folders of a table that is being made: some 100 bytes each.
constexpr size_t kMostEarly = 200'000;
constexpr char kLimitFile[] = "/proc/sys/fs/inotify/max_user_watches";
// As small as the kernel makes the limit on the smallest machines.
constexpr int kUsualLimit = 8192;
constexpr std::uint32_t kMask =
    IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_ATTRIB | IN_ONLYDIR | IN_EXCL_UNLINK;

// Other programs of the user need some as well.
int Budget() {
  // Not by ReadWholeFile: the kernel gives such a file in one read alone.
  int limit = 0;
  if (!(std::ifstream(kLimitFile) >> limit) || limit <= 0) limit = kUsualLimit;
  return limit / 2;
}

}  // namespace

InotifySource::InotifySource(UniqueFd queue, int budget)
    : queue_(std::move(queue)), budget_(budget), left_(budget) {}

Result<std::unique_ptr<InotifySource>> InotifySource::Make() {
  UniqueFd queue(inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
  if (!queue) return ErrnoError();
  return std::unique_ptr<InotifySource>(new InotifySource(std::move(queue), Budget()));
}

int InotifySource::Watch(int folder_fd) {
  if (left_.fetch_sub(1) <= 0) return -1;
  const std::string path = "/proc/self/fd/" + std::to_string(folder_fd);
  return inotify_add_watch(queue_.get(), path.c_str(), kMask);
}

void InotifySource::Adopt(Watches watches, EventSink& sink) {
  watches.merge(watches_);
  watches_ = std::move(watches);
  left_ = budget_ - static_cast<int>(watches_.size());
  const std::vector<Early> early = std::exchange(early_, {});
  for (const Early& event : early) {
    if (watches_.contains(event.watch)) TellOne(event.watch, event.mask, event.name, sink);
  }
}

void InotifySource::Forget(const NameTable& table) {
  std::erase_if(watches_, [&](const auto& watch) {
    if (table.Find(watch.second) != NameTable::kNoFolder) return false;
    inotify_rm_watch(queue_.get(), watch.first);
    return true;
  });
  left_ = budget_ - static_cast<int>(watches_.size());
}

size_t InotifySource::Waiting() const {
  int bytes = 0;
  return ioctl(queue_.get(), FIONREAD, &bytes) == 0 && bytes > 0 ? static_cast<size_t>(bytes) : 0;
}

size_t InotifySource::Take(size_t much, EventSink& sink) {
  alignas(inotify_event) std::array<char, kBufferBytes> buffer;
  size_t taken = 0;
  while (taken < much) {
    const ssize_t got =
        Uninterrupted([&] { return read(queue_.get(), buffer.data(), buffer.size()); });
    if (got <= 0) break;
    taken += static_cast<size_t>(got);
    std::string_view events(buffer.data(), static_cast<size_t>(got));
    while (events.size() >= sizeof(inotify_event)) {
      inotify_event event;
      std::memcpy(&event, events.data(), sizeof event);
      std::string_view name = events.substr(sizeof event, event.len);
      name = name.substr(0, name.find('\0'));
      TellOne(event.wd, event.mask, name, sink);
      events.remove_prefix(sizeof event + event.len);
    }
  }
  return taken;
}

void InotifySource::TellOne(int watch, std::uint32_t mask, std::string_view name, EventSink& sink) {
  if ((mask & IN_Q_OVERFLOW) != 0) {
    sink.Lost();
    return;
  }
  const auto folder = watches_.find(watch);
  if (folder == watches_.end()) {
    // Known to the process alone that makes a table now, or of a folder that is gone for good.
    if (early_.size() == kMostEarly) {
      early_.clear();
      sink.Lost();
    }
    early_.push_back({watch, mask, std::string(name)});
    return;
  }
  if ((mask & (IN_IGNORED | IN_UNMOUNT)) != 0) {
    watches_.erase(folder);
    ++left_;
    return;
  }
  if (name.empty()) {
    sink.FolderChanged(folder->second);
  } else if ((mask & IN_ISDIR) != 0 && (mask & (IN_CREATE | IN_MOVED_TO | IN_ATTRIB)) != 0) {
    sink.TreeCame(folder->second, name);
  } else {
    sink.NameChanged(folder->second, name);
  }
}

}  // namespace nas
