#include "nas/webapi/runner.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>

#include "nas/base/error.h"
#include "nas/base/json_text.h"
#include "nas/base/system_call.h"
#include "nas/webapi/request_child.h"

namespace nas {
namespace {

constexpr size_t kHeaderBytes = sizeof(std::uint64_t);
constexpr size_t kReadBytes = size_t{64} << 10;
constexpr int kPipeBytes = 1 << 20;
// No reply is that large: such a length comes from a child gone wrong, and is never met.
constexpr std::uint64_t kMaxPayload = std::uint64_t{16} << 30;
// Room taken at once on the word of a length; more only as bytes come.
constexpr std::uint64_t kMaxReserve = std::uint64_t{64} << 20;
constexpr int kForever = -1;

// Reads once. False at the end of the pipe or on an error.
bool ReadSome(int fd, std::string* buffer, FrameReader* frame) {
  buffer->resize(kReadBytes);
  const ssize_t count = Uninterrupted([&] { return read(fd, buffer->data(), buffer->size()); });
  if (count > 0) frame->Feed(buffer->data(), static_cast<size_t>(count));
  return count > 0;
}

// Collects the frame; false when `go_on` ended the wait. The pipe's end does not tell the child's
// death, since a worker the call forked may hold the pipe open for hours; the process descriptor
// does. What the child wrote before it died is still read.
bool Collect(const RunningCall& running, int process_fd, const std::function<bool()>& go_on,
             FrameReader* frame) {
  std::string buffer;
  bool dead = false;
  while (!frame->whole()) {
    pollfd watched[] = {{running.fd.get(), POLLIN, 0}, {process_fd, POLLIN, 0}};
    const int patience = dead ? 0 : go_on ? kAskMilliseconds : kForever;
    const int ready = poll(watched, process_fd < 0 || dead ? 1 : 2, patience);
    if (ready < 0 && errno != EINTR) return true;
    if (!dead && ready <= 0) {
      if (go_on && !go_on()) return false;
    } else if (watched[0].revents != 0) {
      if (!ReadSome(running.fd.get(), &buffer, frame)) return true;
    } else if (dead) {
      if (ready == 0) return true;
    } else {
      dead = watched[1].revents != 0;
    }
  }
  return true;
}

void Reap(pid_t child) {
  Uninterrupted([=] { return waitpid(child, nullptr, 0); });
}

}  // namespace

std::string EncodeJsonReply(int code, const Json::Value& data) {
  std::string text = "{\"code\":" + std::to_string(code) + ",\"data\":";
  AppendJson(data, JsonBytes::kClean, &text);
  text += '}';
  return text;
}

bool FrameReader::Feed(const char* bytes, size_t count) {
  if (whole_) return true;
  if (header_.size() < kHeaderBytes) {
    const size_t part = std::min(kHeaderBytes - header_.size(), count);
    header_.append(bytes, part);
    bytes += part;
    count -= part;
    if (header_.size() < kHeaderBytes) return false;
    std::uint64_t length = 0;
    std::memcpy(&length, header_.data(), sizeof length);
    expected_ = length;
    payload_.reserve(std::min<std::uint64_t>(length, kMaxReserve));
  }
  if (expected_ > kMaxPayload) return false;
  payload_.append(bytes, std::min<std::uint64_t>(expected_ - payload_.size(), count));
  whole_ = payload_.size() == expected_;
  return whole_;
}

RunningCall StartCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode) {
  RunningCall running;
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) {
    SetLastError(kErrorOther);
    return running;
  }
  // A large reply is then written in a few steps, mostly without waiting for its reader. An
  // unprivileged process may have used up its share of such room; then it takes a little longer.
  fcntl(ends[1], F_SETPIPE_SZ, kPipeBytes);
  running.fd = UniqueFd(ends[0]);
  const UniqueFd writable(ends[1]);
  running.pid = fork();
  if (running.pid == 0) ServeInChild(row, call, encode, writable.get());
  if (running.pid < 0) {
    SetLastError(kErrorOther);
    running.fd.Reset();
  }
  return running;
}

std::string FinishCall(RunningCall running, const ReplyEncoder& encode,
                       const std::function<bool()>& go_on) {
  FrameReader frame;
  if (running.pid > 0) {
    const UniqueFd process(static_cast<int>(syscall(SYS_pidfd_open, running.pid, 0)));
    if (!Collect(running, process.get(), go_on, &frame)) {
      AbandonCall(std::move(running));
      return {};
    }
    running.fd.Reset();
    Reap(running.pid);
  }
  return frame.whole() ? frame.TakePayload() : encode(kCodeUnknownFailure, Json::Value());
}

void AbandonCall(RunningCall running) {
  if (running.pid <= 0) return;
  kill(running.pid, SIGKILL);
  Reap(running.pid);
}

std::string RunCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode) {
  return FinishCall(StartCall(row, call, encode), encode);
}

}  // namespace nas
