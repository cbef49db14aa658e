#include "nas/index/daemon_socket.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "nas/system/config.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

constexpr char kSystemSocket[] = "/run/arbory/index.sock";
constexpr char kSocketName[] = "/index.sock";
// That are connected and not yet looked at; further askers walk.
constexpr int kBacklog = 64;
constexpr int kMillisecondsPerSecond = 1000;
constexpr int kMicrosecondsPerMillisecond = 1000;
constexpr mode_t kFolderMode = 0755;

std::string InState() { return CurrentConfig().state_dir + kSocketName; }

// A socket's address holds little more than a hundred bytes, a path more: it is then told by its
// folder, which stays open as long as this lives.
class Address {
 public:
  explicit Address(const std::string& path) {
    address_.sun_family = AF_UNIX;
    std::string text = path;
    if (text.size() >= sizeof address_.sun_path) {
      const size_t slash = path.rfind('/');
      folder_.Reset(open(path.substr(0, slash).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
      if (!folder_) {
        failed_ = errno;
        return;
      }
      text = "/proc/self/fd/" + std::to_string(folder_.get()) + path.substr(slash);
    }
    if (text.size() >= sizeof address_.sun_path) {
      failed_ = ENAMETOOLONG;
      return;
    }
    std::memcpy(address_.sun_path, text.c_str(), text.size() + 1);
  }
  int failed() const { return failed_; }
  const char* path() const { return address_.sun_path; }
  const sockaddr* get() const { return reinterpret_cast<const sockaddr*>(&address_); }
  static constexpr socklen_t size() { return sizeof(sockaddr_un); }

 private:
  sockaddr_un address_ = {};
  UniqueFd folder_;
  int failed_ = 0;
};

UniqueFd NewSocket() {
  return UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

// Waits in reads and writes, but not for ever.
Status MakeWaiting(int connection, int timeout_ms) {
  timeval bound = {};
  bound.tv_sec = timeout_ms / kMillisecondsPerSecond;
  bound.tv_usec =
      static_cast<suseconds_t>(timeout_ms % kMillisecondsPerSecond) * kMicrosecondsPerMillisecond;
  const int flags = fcntl(connection, F_GETFL);
  const bool done = flags >= 0 && fcntl(connection, F_SETFL, flags & ~O_NONBLOCK) == 0 &&
                    setsockopt(connection, SOL_SOCKET, SO_SNDTIMEO, &bound, sizeof bound) == 0 &&
                    setsockopt(connection, SOL_SOCKET, SO_RCVTIMEO, &bound, sizeof bound) == 0;
  return done ? Status() : ErrnoError();
}

Result<ucred> CredentialsOf(int connection) {
  ucred peer = {};
  socklen_t size = sizeof peer;
  if (getsockopt(connection, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return ErrnoError();
  return peer;
}

// Takes away the socket of a daemon that is gone.
Status RemoveAbandoned(const Address& address, const std::string& path) {
  struct stat status;
  if (lstat(address.path(), &status) != 0) return errno == ENOENT ? Status() : ErrnoError(path);
  if (!S_ISSOCK(status.st_mode)) return ErrnoError(EEXIST, path);
  const UniqueFd attempt = NewSocket();
  if (!attempt) return ErrnoError(path);
  if (connect(attempt.get(), address.get(), Address::size()) == 0 || errno != ECONNREFUSED) {
    return ErrnoError(EADDRINUSE, path);
  }
  return unlink(address.path()) == 0 ? Status() : ErrnoError(path);
}

}  // namespace

std::string OwnIndexSocket() {
  const Config& config = CurrentConfig();
  if (!config.index.socket.empty()) return config.index.socket;
  return geteuid() == 0 && config.state_dir == kSystemStateDir ? kSystemSocket : InState();
}

std::vector<std::string> IndexSockets() {
  const Config& config = CurrentConfig();
  if (!config.index.socket.empty()) return {config.index.socket};
  return {InState(), kSystemSocket};
}

Result<UniqueFd> ConnectToIndex(const std::string& path, int timeout_ms) {
  const Address address(path);
  if (address.failed() != 0) return ErrnoError(address.failed(), path);
  UniqueFd connection = NewSocket();
  if (!connection || connect(connection.get(), address.get(), Address::size()) != 0) {
    return ErrnoError(path);
  }
  const auto listener = CredentialsOf(connection.get());
  if (!listener) return listener.error().Of(path);
  if (listener->uid != 0 && listener->uid != geteuid()) return ErrnoError(EPERM, path);
  const Status waiting = MakeWaiting(connection.get(), timeout_ms);
  if (!waiting) return waiting.error().Of(path);
  return connection;
}

Result<UniqueFd> ListenForIndex(const std::string& path) {
  const std::string folder = path.substr(0, path.rfind('/'));
  const Status made = MakeFolders(folder, kFolderMode);
  if (!made) return made.error();
  const auto opened = OpenTopFolder(folder);
  if (!opened) return opened.error();
  const Status safe = CheckSafeFrom(opened->get(), geteuid());
  if (!safe) return safe.error().Of(folder);
  const Address address(path);
  if (address.failed() != 0) return ErrnoError(address.failed(), path);
  const Status removed = RemoveAbandoned(address, path);
  if (!removed) return removed.error();
  UniqueFd listener = NewSocket();
  const ScopedUmask mask(geteuid() == 0 ? S_IXUSR | S_IXGRP | S_IXOTH
                                        : S_IXUSR | S_IRWXG | S_IRWXO);
  if (!listener || bind(listener.get(), address.get(), Address::size()) != 0 ||
      listen(listener.get(), kBacklog) != 0) {
    return ErrnoError(path);
  }
  return listener;
}

Result<Peer> PeerOf(int connection) {
  const auto credentials = CredentialsOf(connection);
  if (!credentials) return credentials.error();
  Peer peer = {credentials->uid, credentials->gid, {}};
  socklen_t size = 0;
  if (getsockopt(connection, SOL_SOCKET, SO_PEERGROUPS, nullptr, &size) != 0 && errno != ERANGE) {
    return ErrnoError();
  }
  peer.groups.resize(size / sizeof(gid_t));
  if (size > 0 &&
      getsockopt(connection, SOL_SOCKET, SO_PEERGROUPS, peer.groups.data(), &size) != 0) {
    return ErrnoError();
  }
  return peer;
}

}  // namespace nas
