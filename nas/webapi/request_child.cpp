#include "nas/webapi/request_child.h"

#include <fcntl.h>
#include <sys/uio.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <exception>
#include <optional>

#include "nas/base/file_io.h"
#include "nas/system/user_state.h"
#include "platform/webfm.h"

namespace nas {
namespace {

constexpr int kFirstFreeFd = 3;
// Set in tests, whose sanitizers report there what goes wrong in a child.
constexpr char kKeepStandardError[] = "ARBORY_CHILD_STDERR";

class Request : public NUVA::APIRequest {
 public:
  Request(const NUVA::APIMethod& row, const ApiCall& call) : row_(row), call_(call) {}

  std::string GetLoginUserName() const override { return call_.user; }
  std::string GetSessionID() const override { return call_.session; }
  std::string GetPreferenceDir() const override { return PreferenceFolder(call_.user); }
  std::string GetAPIMethod() const override { return call_.method; }
  int GetAPIVersion() const override { return row_.version; }

  bool HasParam(const std::string& name) const override {
    return call_.params.isObject() && call_.params.isMember(name);
  }
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const override {
    return HasParam(name) ? call_.params[name] : fallback;
  }

 private:
  const NUVA::APIMethod& row_;
  const ApiCall& call_;
};

class Response : public NUVA::APIResponse {
 public:
  explicit Response(const ReplyEncoder& encode) : encode_(encode) {}

  void SetError(int code, const Json::Value& data) override { reply_ = encode_(code, data); }
  const std::optional<std::string>& reply() const { return reply_; }

 private:
  const ReplyEncoder& encode_;
  std::optional<std::string> reply_;
};

// The caller may be a server with handlers and masked signals; a module expects a plain process.
void ResetSignals() {
  for (int signal_number = 1; signal_number < NSIG; ++signal_number) {
    signal(signal_number, SIG_DFL);
  }
  // A caller that has gone away must show as a failed write, not end a worker.
  signal(SIGPIPE, SIG_IGN);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

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

void SendFrame(int fd, const std::string& payload) {
  const std::uint64_t length = payload.size();
  const std::string_view header(reinterpret_cast<const char*>(&length), sizeof length);
  // Nobody is left to be told of a failure here: the caller has gone.
  if (WriteAll(fd, header)) (void)WriteAll(fd, payload);
}

std::string Serve(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode) {
  if (const Status entered = EnterUserState(call.user); !entered) {
    Report(entered.error());
    return encode(WfmLibGetErr(), Json::Value());
  }
  Request request(row, call);
  Response response(encode);
  try {
    row.entry(&request, &response);
    if (response.reply()) return *response.reply();
    syslog(LOG_ERR, "%s %s gave no reply", row.api, row.method);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s %s failed: %s", row.api, row.method, error.what());
  } catch (...) {
    syslog(LOG_ERR, "%s %s failed", row.api, row.method);
  }
  return encode(kCodeUnknownFailure, Json::Value());
}

}  // namespace

int EnterChild(int fd) {
  setpgid(0, 0);  // before the caller's signal handlers go
  ResetSignals();
  return KeepOnly(fd);
}

void ServeInChild(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode,
                  int pipe_fd) {
  const pid_t self = getpid();
  const int pipe = EnterChild(pipe_fd);
  if (pipe >= 0) {
    try {
      const std::string reply = Serve(row, call, encode);
      if (getpid() == self) SendFrame(pipe, reply);
    } catch (...) {
      // Even the reply to a failure could not be made: the caller finds none, and answers.
    }
  }
  // Exit handlers and buffered output are the caller's, not this process's.
  _exit(EXIT_SUCCESS);
}

}  // namespace nas
