// What the machine itself takes, below which no search can go:
//
//   floor walk DIR THREADS   opens every folder and reads its entries, nothing else
//   floor read DIR THREADS   the same, and reads every regular file to its end
//
// Prints how many folders, entries and bytes it saw.

#include <dirent.h>
#include <fcntl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace {

constexpr size_t kBufferBytes = 256 * 1024;

std::atomic<std::uint64_t> g_folders = 0;
std::atomic<std::uint64_t> g_entries = 0;
std::atomic<std::uint64_t> g_bytes = 0;
bool g_read_files = false;

// A descriptor that several waiting sub-folders share.
struct Handle {
  explicit Handle(int opened) : fd(opened) {}
  ~Handle() { close(fd); }
  Handle(const Handle&) = delete;
  Handle& operator=(const Handle&) = delete;
  const int fd;
};

struct Folder {
  std::shared_ptr<Handle> parent;
  std::string name;
};

class Stack {
 public:
  void Push(std::vector<Folder>& folders) {
    const std::lock_guard lock(mutex_);
    for (Folder& folder : folders) waiting_.push_back(std::move(folder));
    folders.clear();
    changed_.notify_all();
  }
  bool Take(Folder& folder, bool& holding) {
    std::unique_lock lock(mutex_);
    if (holding) --busy_;
    changed_.wait(lock, [this] { return !waiting_.empty() || busy_ == 0; });
    holding = !waiting_.empty();
    if (!holding) {
      changed_.notify_all();
      return false;
    }
    folder = std::move(waiting_.back());
    waiting_.pop_back();
    ++busy_;
    return true;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<Folder> waiting_;
  int busy_ = 0;
};

void ReadFile(int folder, const char* name, char* buffer) {
  const int fd = openat(folder, name, O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
  if (fd < 0) return;
  ssize_t count;
  do {
    count = read(fd, buffer, kBufferBytes);
    if (count > 0) g_bytes += static_cast<std::uint64_t>(count);
  } while (count == static_cast<ssize_t>(kBufferBytes));
  close(fd);
}

void Work(Stack& stack) {
  const auto buffer = std::make_unique<char[]>(kBufferBytes);
  const auto file_buffer = std::make_unique<char[]>(kBufferBytes);
  std::vector<Folder> below;
  Folder folder;
  bool holding = false;
  while (stack.Take(folder, holding)) {
    const int fd = openat(folder.parent ? folder.parent->fd : AT_FDCWD, folder.name.c_str(),
                          O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW);
    folder.parent.reset();
    if (fd < 0) continue;
    const auto handle = std::make_shared<Handle>(fd);
    std::uint64_t entries = 0;
    long filled;
    while ((filled = syscall(SYS_getdents64, fd, buffer.get(), kBufferBytes)) > 0) {
      for (long at = 0; at < filled;) {
        const auto* entry = reinterpret_cast<const dirent64*>(buffer.get() + at);
        at += entry->d_reclen;
        if (std::strcmp(entry->d_name, ".") == 0 || std::strcmp(entry->d_name, "..") == 0) continue;
        ++entries;
        if (entry->d_type == DT_DIR) below.push_back({handle, entry->d_name});
        if (g_read_files && entry->d_type == DT_REG) ReadFile(fd, entry->d_name, file_buffer.get());
      }
    }
    ++g_folders;
    g_entries += entries;
    if (!below.empty()) stack.Push(below);
  }
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 4) {
    std::fprintf(stderr, "usage: floor walk|read DIR THREADS\n");
    return 2;
  }
  g_read_files = std::string_view(argv[1]) == "read";
  Stack stack;
  std::vector<Folder> roots = {{nullptr, argv[2]}};
  stack.Push(roots);
  {
    std::vector<std::jthread> threads;
    for (int i = std::atoi(argv[3]); i > 0; --i) threads.emplace_back(Work, std::ref(stack));
  }
  std::printf("%llu folders, %llu entries, %llu bytes\n",
              static_cast<unsigned long long>(g_folders),
              static_cast<unsigned long long>(g_entries), static_cast<unsigned long long>(g_bytes));
  return 0;
}
