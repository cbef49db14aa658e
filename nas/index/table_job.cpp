#include "nas/index/table_job.h"

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>

#include "nas/base/system_call.h"
#include "nas/system/child.h"

namespace nas {
namespace {

constexpr int kNiceness = 10;
// As ioprio_set(2) takes them; the system's header for them is none for C++.
constexpr int kOfProcess = 1;
constexpr int kIdleClass = 3 << 13;
constexpr size_t kPieceBytes = size_t{64} << 10;
// Of all that a child says: some 60 bytes for each of five million folders.
constexpr size_t kMaxOutputBytes = size_t{320} << 20;

[[noreturn]] void Run(bool idle, pid_t parent, int pipe, const std::function<int(int pipe)>& body) {
  ResetSignals();
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  OfferToOutOfMemoryKiller();
  setpriority(PRIO_PROCESS, 0, kNiceness);
  if (idle) {
    syscall(SYS_ioprio_set, kOfProcess, 0, kIdleClass);
  }
  int result = EIO;
  try {
    if (getppid() == parent) result = body(pipe);
  } catch (const std::bad_alloc&) {
    result = ENOMEM;
  } catch (...) {
    // As it is of a child that dies.
  }
  _exit(result);
}

}  // namespace

Result<std::unique_ptr<TableJob>> TableJob::Start(bool idle,
                                                  const std::function<int(int pipe)>& body) {
  std::array<int, 2> ends;
  if (pipe2(ends.data(), O_CLOEXEC) != 0) return ErrnoError();
  UniqueFd readable(ends[0]);
  const UniqueFd writable(ends[1]);
  const pid_t parent = getpid();
  const pid_t pid = fork();
  if (pid == 0) Run(idle, parent, writable.get(), body);
  if (pid < 0) return ErrnoError();
  fcntl(readable.get(), F_SETFL, O_NONBLOCK);
  return std::unique_ptr<TableJob>(new TableJob(pid, std::move(readable)));
}

TableJob::~TableJob() {
  if (pid_ < 0) return;
  kill(pid_, SIGKILL);
  Finish();
}

bool TableJob::Read() {
  std::array<char, kPieceBytes> piece;
  for (;;) {
    const ssize_t got =
        Uninterrupted([&] { return read(pipe_.get(), piece.data(), piece.size()); });
    if (got < 0) return errno != EAGAIN;
    if (got == 0) return true;
    if (output_.size() + static_cast<size_t>(got) > kMaxOutputBytes) {
      kill(pid_, SIGKILL);
      return true;
    }
    output_.append(piece.data(), static_cast<size_t>(got));
  }
}

int TableJob::Finish() {
  int status = 0;
  const pid_t ended = Uninterrupted([&] { return waitpid(pid_, &status, 0); });
  pid_ = -1;
  return ended > 0 && WIFEXITED(status) ? WEXITSTATUS(status) : EIO;
}

}  // namespace nas
