#include "nas/index/fanotify_source.h"

#include <fcntl.h>
#include <sys/fanotify.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <vector>

#include "nas/base/system_call.h"

namespace nas {
namespace {

// About a thousand events of usual names at a time.
constexpr size_t kBufferBytes = size_t{128} << 10;
// Newer than some headers: the moves of both folders as one event (Linux 5.17).
constexpr std::uint64_t kNames =
    FAN_CREATE | FAN_DELETE | FAN_ATTRIB | FAN_ONDIR | FAN_EVENT_ON_CHILD;
constexpr std::uint64_t kMoves = FAN_MOVED_FROM | FAN_MOVED_TO;
// A file that was mapped changes without a word until it is closed.
constexpr std::uint64_t kWrites = FAN_MODIFY | FAN_CLOSE_WRITE;
// That may have brought a folder with all that is in it.
constexpr std::uint64_t kArrivals = FAN_CREATE | FAN_MOVED_TO | FAN_RENAME;

// One record of an event, looked at where it lies in the buffer.
struct Record {
  std::uint8_t type = 0;
  FolderKey key;
  std::string_view handle;  // struct file_handle and its bytes
  std::string_view name;    // empty where the record has none
};

// False where the record is of another kind or says more bytes than it has.
bool ReadRecord(std::string_view bytes, Record* record) {
  if (bytes.size() < sizeof(fanotify_event_info_fid) + sizeof(file_handle)) return false;
  fanotify_event_info_header header;
  std::memcpy(&header, bytes.data(), sizeof header);
  switch (header.info_type) {
    case FAN_EVENT_INFO_TYPE_FID:
    case FAN_EVENT_INFO_TYPE_DFID:
    case FAN_EVENT_INFO_TYPE_DFID_NAME:
    case FAN_EVENT_INFO_TYPE_OLD_DFID_NAME:
    case FAN_EVENT_INFO_TYPE_NEW_DFID_NAME:
      break;
    default:
      return false;
  }
  record->type = header.info_type;
  const std::string_view rest = bytes.substr(sizeof(fanotify_event_info_fid));
  file_handle head;
  std::memcpy(&head, rest.data(), sizeof head);
  if (rest.size() - sizeof head < head.handle_bytes) return false;
  record->handle = rest.substr(0, sizeof head + head.handle_bytes);
  record->key = MakeFolderKey(head.handle_type, record->handle.substr(sizeof head));
  record->name = {};
  if (header.info_type >= FAN_EVENT_INFO_TYPE_DFID_NAME &&
      header.info_type != FAN_EVENT_INFO_TYPE_DFID) {
    record->name = rest.substr(record->handle.size());
    record->name = record->name.substr(0, record->name.find('\0'));
  }
  return true;
}

class FanotifySource : public EventSource {
 public:
  FanotifySource(UniqueFd queue, int mount_fd, bool writes)
      : queue_(std::move(queue)), mount_fd_(mount_fd), writes_(writes), buffer_(kBufferBytes) {}

  int fd() const override { return queue_.get(); }
  bool TellsAttributes() const override { return writes_; }

  // The kernel counts each event as its head alone, and so does Take.
  size_t Waiting() const override {
    int bytes = 0;
    return ioctl(queue_.get(), FIONREAD, &bytes) == 0 && bytes > 0 ? static_cast<size_t>(bytes) : 0;
  }

  size_t Take(size_t much, EventSink& sink) override {
    size_t taken = 0;
    while (taken < much) {
      const ssize_t got =
          Uninterrupted([&] { return read(queue_.get(), buffer_.data(), buffer_.size()); });
      if (got <= 0) break;
      taken += FAN_EVENT_METADATA_LEN * Tell({buffer_.data(), static_cast<size_t>(got)}, sink);
    }
    return taken;
  }

 private:
  // Returns how many events there were, one at least.
  size_t Tell(std::string_view events, EventSink& sink) {
    size_t count = 0;
    while (events.size() >= sizeof(fanotify_event_metadata)) {
      fanotify_event_metadata event;
      std::memcpy(&event, events.data(), sizeof event);
      if (event.vers != FANOTIFY_METADATA_VERSION || event.event_len < event.metadata_len ||
          event.event_len > events.size()) {
        sink.Lost();
        return count + 1;
      }
      ++count;
      TellEvent(event, events.substr(event.metadata_len, event.event_len - event.metadata_len),
                sink);
      events.remove_prefix(event.event_len);
    }
    return count;
  }

  void TellEvent(const fanotify_event_metadata& event, std::string_view records, EventSink& sink) {
    if ((event.mask & FAN_Q_OVERFLOW) != 0) {
      sink.Lost();
      return;
    }
    const bool folder_came = (event.mask & FAN_ONDIR) != 0 && (event.mask & kArrivals) != 0;
    bool named = false;
    Record record;
    std::string_view target;
    while (records.size() >= sizeof(fanotify_event_info_header)) {
      fanotify_event_info_header header;
      std::memcpy(&header, records.data(), sizeof header);
      if (header.len < sizeof header || header.len > records.size()) break;
      if (ReadRecord(records.substr(0, header.len), &record)) {
        if (record.type == FAN_EVENT_INFO_TYPE_FID) {
          target = record.handle;
        } else {
          TellName(record, folder_came, sink);
          named = true;
        }
      }
      records.remove_prefix(header.len);
    }
    if (!named && !target.empty()) TellInode(target, sink);
  }

  static void TellName(const Record& record, bool folder_came, EventSink& sink) {
    if (record.name.empty() || record.name == ".") {
      sink.FolderChanged(record.key);
    } else if (folder_came && record.type != FAN_EVENT_INFO_TYPE_OLD_DFID_NAME) {
      sink.TreeCame(record.key, record.name);
    } else {
      sink.NameChanged(record.key, record.name);
    }
  }

  // A file that got another name or lost one of several has changed under the rest of them too,
  // which the event does not tell. Of one that is gone for good there is nothing to find.
  void TellInode(std::string_view handle, EventSink& sink) {
    alignas(file_handle) std::array<char, sizeof(file_handle) + MAX_HANDLE_SZ> copy;
    if (handle.size() > copy.size()) return;
    std::memcpy(copy.data(), handle.data(), handle.size());
    const UniqueFd file(open_by_handle_at(mount_fd_, reinterpret_cast<file_handle*>(copy.data()),
                                          O_PATH | O_CLOEXEC));
    struct stat status;
    if (file && fstat(file.get(), &status) == 0) sink.InodeChanged(status.st_ino);
  }

  UniqueFd queue_;
  int mount_fd_;
  bool writes_;
  std::vector<char> buffer_;
};

}  // namespace

Result<std::unique_ptr<EventSource>> WatchFileSystem(int folder_fd, int top_fd, bool writes) {
  constexpr unsigned kFlags = FAN_CLASS_NOTIF | FAN_CLOEXEC | FAN_NONBLOCK | FAN_UNLIMITED_QUEUE |
                              FAN_REPORT_DFID_NAME_TARGET;
  UniqueFd queue(fanotify_init(kFlags, O_RDONLY | O_CLOEXEC));
  if (!queue) return ErrnoError();
  const std::uint64_t wanted = kNames | (writes ? kWrites : 0);
  const int marked = top_fd >= 0 ? top_fd : folder_fd;
  const auto mark = [&](std::uint64_t mask) {
    return fanotify_mark(queue.get(), FAN_MARK_ADD | FAN_MARK_FILESYSTEM, mask, marked, nullptr) ==
           0;
  };
  if (!mark(wanted | FAN_RENAME) && (errno != EINVAL || !mark(wanted | kMoves)))
    return ErrnoError();
  return std::unique_ptr<EventSource>(
      std::make_unique<FanotifySource>(std::move(queue), folder_fd, writes));
}

}  // namespace nas
