#pragma once
// A watcher as the broker has it: the process, the way to it, and what it tells of itself.

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "nas/base/unique_fd.h"
#include "nas/index/descriptors.h"
#include "nas/index/figures.h"
#include "nas/index/trees.h"

namespace nas {

// How long to wait before a watcher that has ended is started again, where the time before was
// `before` and it had answered for so long, nothing where it never came to answer.
std::chrono::steady_clock::duration RestartPause(std::chrono::steady_clock::duration before,
                                                 std::chrono::steady_clock::duration answered);

class WatcherProcess {
 public:
  using Clock = std::chrono::steady_clock;

  // Throws std::bad_alloc where there is no memory to share.
  explicit WatcherProcess(FileSystem file_system);
  // Ends the process at once, with all that it started.
  ~WatcherProcess();
  WatcherProcess(const WatcherProcess&) = delete;
  WatcherProcess& operator=(const WatcherProcess&) = delete;

  // Forks it, unless it runs or must not be tried again yet. In the child `in_child` closes what is
  // the broker's, and does not return.
  void Start(const std::function<void(UniqueFd broker, Figures* figures)>& in_child);
  // When Start is worth a call; never while it runs.
  std::optional<Clock::time_point> next_start() const;
  // Whether that was this process, which is gone then.
  bool Ended(pid_t pid);
  // Asks it to write its table and end.
  void AskToEnd() const;
  bool running() const { return pid_ >= 0; }
  // Hands it on. False where it takes no more.
  bool Send(const Hello& hello, std::span<const int> descriptors) const;

  const FileSystem& file_system() const { return file_system_; }
  const Figures& figures() const { return *figures_; }
  pid_t pid() const { return pid_; }

 private:
  struct Unmap {
    void operator()(Figures* figures) const;
  };
  FileSystem file_system_;
  std::unique_ptr<Figures, Unmap> figures_;
  pid_t pid_ = -1;
  UniqueFd channel_;
  Clock::time_point next_start_;
  Clock::duration pause_;
};

}  // namespace nas
