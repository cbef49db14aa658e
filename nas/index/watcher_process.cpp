#include "nas/index/watcher_process.h"

#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <new>

#include "nas/base/system_call.h"

namespace nas {
namespace {

constexpr std::chrono::seconds kFirstPause{1};
constexpr std::chrono::seconds kLongestPause{60};
// One that answered for so long was of use, and has not died of what it began with: starting it at
// once costs less than the folders that everybody walks meanwhile.
constexpr std::chrono::seconds kUsefulLife{10};

Figures* ShareFigures() {
  void* memory =
      mmap(nullptr, sizeof(Figures), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) throw std::bad_alloc();
  return new (memory) Figures;
}

}  // namespace

std::chrono::steady_clock::duration RestartPause(std::chrono::steady_clock::duration before,
                                                 std::chrono::steady_clock::duration answered) {
  if (answered >= kUsefulLife) return kFirstPause;
  return std::min<std::chrono::steady_clock::duration>(before * 2, kLongestPause);
}

void WatcherProcess::Unmap::operator()(Figures* figures) const { munmap(figures, sizeof *figures); }

WatcherProcess::WatcherProcess(FileSystem file_system)
    : file_system_(std::move(file_system)), figures_(ShareFigures()), pause_(kFirstPause) {}

WatcherProcess::~WatcherProcess() {
  if (pid_ < 0) return;
  kill(pid_, SIGKILL);
  Uninterrupted([&] { return waitpid(pid_, nullptr, 0); });
}

void WatcherProcess::Start(const std::function<void(UniqueFd broker, Figures* figures)>& in_child) {
  std::array<int, 2> ends;
  if (running() || Clock::now() < next_start_) return;
  next_start_ = Clock::now() + pause_;
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()) != 0)
    return;
  channel_.Reset(ends[0]);
  UniqueFd theirs(ends[1]);
  figures_->state = IndexState::kStarting;
  figures_->answers_since_ns = 0;
  pid_ = fork();
  if (pid_ == 0) {
    prctl(PR_SET_NAME, "arbory-watcher");
    channel_.Reset();
    in_child(std::move(theirs), figures_.get());
    _exit(EXIT_FAILURE);
  }
}

std::optional<WatcherProcess::Clock::time_point> WatcherProcess::next_start() const {
  if (running()) return std::nullopt;
  return next_start_;
}

bool WatcherProcess::Ended(pid_t pid) {
  if (pid != pid_) return false;
  pid_ = -1;
  channel_.Reset();
  figures_->state = IndexState::kStarting;
  const Clock::time_point now = Clock::now();
  const std::chrono::nanoseconds since(figures_->answers_since_ns);
  pause_ = RestartPause(
      pause_, since.count() == 0 ? Clock::duration::zero() : now.time_since_epoch() - since);
  next_start_ = now + pause_;
  return true;
}

void WatcherProcess::AskToEnd() const {
  if (running()) kill(pid_, SIGTERM);
}

bool WatcherProcess::Send(const Hello& hello, std::span<const int> descriptors) const {
  return running() && SendMessage(channel_.get(), hello, descriptors);
}

}  // namespace nas
