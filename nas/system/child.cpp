#include "nas/system/child.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <csignal>
#include <cstdlib>
#include <cstring>

#include "nas/base/error.h"
#include "nas/base/file_io.h"
#include "nas/system/memory.h"
#include "platform/system.h"

namespace nas {
namespace {

constexpr int kFirstFreeFd = 3;
// Set in tests, whose sanitizers report there what goes wrong in a child.
constexpr char kKeepStandardError[] = "ARBORY_CHILD_STDERR";

// Half of what makes a process the first to be killed. A sorter has the same as the worker that it
// belongs to, but several times its memory.
constexpr char kChildScore[] = "500";

constexpr size_t kLengthBytes = sizeof(std::uint64_t);
// Far above what a head holds: a file's name in two encodings and a few short fields.
constexpr size_t kMaxHeadBytes = size_t{16} << 10;
// No file is that large: such a length comes from a child gone wrong, and is never met.
constexpr std::uint64_t kMaxFrameBytes = std::uint64_t{1} << 62;
// A body that a pipe holds as it is made goes with its head in one step.
constexpr std::uint64_t kUsualPipeBytes = std::uint64_t{64} << 10;
constexpr int kLargePipeBytes = 1 << 20;

// Leaves only the standard streams and the pipe open. Returns the pipe's number, which is no longer
// that of a standard stream, or -1.
int KeepOnly(int pipe_fd) {
  // The C library remembers its log socket by number and would write into whatever comes next
  // under that number.
  closelog();
  const int pipe = fcntl(pipe_fd, F_DUPFD_CLOEXEC, kFirstFreeFd);
  const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (pipe < 0 || null < 0) return -1;
  const bool keep_error = std::getenv(kKeepStandardError) != nullptr;
  for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (standard == STDERR_FILENO && keep_error) continue;
    // dup2 onto itself would keep the mark that closes it at the next exec.
    if (null == standard ? fcntl(null, F_SETFD, 0) != 0 : dup2(null, standard) < 0) return -1;
  }
  const auto below = static_cast<unsigned>(pipe - 1);
  const auto above = static_cast<unsigned>(pipe + 1);
  if (pipe > kFirstFreeFd && close_range(kFirstFreeFd, below, 0) != 0) return -1;
  return close_range(above, ~0U, 0) == 0 ? pipe : -1;
}

[[noreturn]] void RunChild(const std::function<void(int pipe)>& body, std::uint64_t memory_bytes,
                           int pipe_fd) {
  setpgid(0, 0);  // before the parent's signal handlers go
  ResetSignals();
  const int pipe = KeepOnly(pipe_fd);
  OfferToOutOfMemoryKiller();
  if (memory_bytes > 0) LimitMemory(memory_bytes);
  SetLastError(kErrorNone);
  try {
    if (pipe >= 0) body(pipe);
  } catch (...) {
    // Nothing was sent, which is an answer too.
  }
  _exit(EXIT_SUCCESS);
}

std::string FrameBegin(const ReplyHead& head, std::uint64_t body_bytes) {
  std::string text = std::to_string(head.status) + " " + std::to_string(head.code) + "\n";
  for (const auto& [name, value] : head.fields) text += name + ": " + value + "\n";
  text += '\n';
  const std::uint64_t length = body_bytes == kUntilEnd ? kUntilEnd : text.size() + body_bytes;
  return std::string(reinterpret_cast<const char*>(&length), sizeof length) + text;
}

bool ParseNumbers(std::string_view line, ReplyHead* head) {
  const char* end = line.data() + line.size();
  const auto status = std::from_chars(line.data(), end, head->status);
  if (status.ec != std::errc() || status.ptr == end || *status.ptr != ' ') return false;
  const auto code = std::from_chars(status.ptr + 1, end, head->code);
  return code.ec == std::errc() && code.ptr == end;
}

// Takes both ends: the first is the caller's, the other the child's.
Child Fork(const int (&ends)[2], const std::function<void(int pipe)>& body,
           std::uint64_t memory_bytes) {
  Child child;
  child.fd = UniqueFd(ends[0]);
  const UniqueFd childs(ends[1]);
  child.pid = fork();
  if (child.pid == 0) RunChild(body, memory_bytes, childs.get());
  if (child.pid < 0) child.fd.Reset();
  return child;
}

}  // namespace

void ResetSignals() {
  for (int signal_number = 1; signal_number < NSIG; ++signal_number) {
    signal(signal_number, SIG_DFL);
  }
  signal(SIGPIPE, SIG_IGN);
  signal(SIGXFSZ, SIG_IGN);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

void OfferToOutOfMemoryKiller() {
  const UniqueFd score(open("/proc/self/oom_score_adj", O_WRONLY | O_CLOEXEC));
  if (score) (void)WriteAll(score.get(), kChildScore);
}

Child StartChild(const std::function<void(int pipe)>& body, std::uint64_t memory_bytes) {
  int ends[2];
  return pipe2(ends, O_CLOEXEC) == 0 ? Fork(ends, body, memory_bytes) : Child();
}

Child StartAnsweringChild(const std::function<void(int connection)>& body) {
  int ends[2];
  const bool made = socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) == 0;
  return made ? Fork(ends, body, 0) : Child();
}

bool SendHead(int pipe, const ReplyHead& head, std::uint64_t body_bytes) {
  // A large body is then written in a few steps, mostly without waiting for its reader. An
  // unprivileged process may have used up its share of such room; then it takes a little longer.
  if (body_bytes > kUsualPipeBytes) fcntl(pipe, F_SETPIPE_SZ, kLargePipeBytes);
  return WriteAll(pipe, FrameBegin(head, body_bytes)).ok();
}

bool SendReply(int pipe, const Reply& reply) {
  if (reply.beginning) {
    return SendHead(pipe, reply.head, reply.beginning->bytes() + reply.body.size()) &&
           reply.beginning->CopyTo(pipe) && WriteAll(pipe, reply.body).ok();
  }
  if (reply.body.size() > kUsualPipeBytes) {
    return SendHead(pipe, reply.head, reply.body.size()) && WriteAll(pipe, reply.body).ok();
  }
  return WriteAll(pipe, FrameBegin(reply.head, reply.body.size()) + reply.body).ok();
}

ReplyReader::State ReplyReader::Feed(std::string_view bytes) {
  bytes_.append(bytes);
  return Parse();
}

ReplyReader::State ReplyReader::Parse() {
  if (bytes_.size() < kLengthBytes) return State::kMore;
  std::uint64_t length = 0;
  std::memcpy(&length, bytes_.data(), sizeof length);
  if (length > kMaxFrameBytes && length != kUntilEnd) return State::kBroken;
  const std::string_view text = std::string_view(bytes_).substr(kLengthBytes);
  const size_t end = text.substr(0, kMaxHeadBytes).find("\n\n");
  if (end == std::string_view::npos) {
    return text.size() >= std::min<std::uint64_t>(kMaxHeadBytes, length) ? State::kBroken
                                                                         : State::kMore;
  }
  const size_t head_bytes = end + 2;
  if (length < head_bytes) return State::kBroken;
  std::string_view rest = text.substr(0, end + 1);
  const std::string_view numbers = rest.substr(0, rest.find('\n'));
  if (!ParseNumbers(numbers, &head_)) return State::kBroken;
  rest.remove_prefix(numbers.size() + 1);
  while (!rest.empty()) {
    const std::string_view line = rest.substr(0, rest.find('\n'));
    rest.remove_prefix(line.size() + 1);
    const size_t colon = line.find(": ");
    if (colon == std::string_view::npos) return State::kBroken;
    head_.fields.emplace_back(line.substr(0, colon), line.substr(colon + 2));
  }
  body_at_ = kLengthBytes + head_bytes;
  body_bytes_ = length == kUntilEnd ? kUntilEnd : length - head_bytes;
  if (body_bytes_ == kUntilEnd) return State::kReady;
  // A worker may have written behind the frame; that is nobody's.
  if (bytes_.size() - body_at_ > body_bytes_) bytes_.resize(body_at_ + body_bytes_);
  return State::kReady;
}

}  // namespace nas

pid_t NLIBCProcFork() {
  const pid_t pid = fork();
  if (pid < 0) nas::SetLastError(nas::kErrorOther);
  if (pid == 0) {
    setsid();
    nas::SetLastError(nas::kErrorNone);
    // A worker's threads have stacks, and a search may need more than a reply.
    nas::LiftMemoryLimit();
  }
  return pid;
}
