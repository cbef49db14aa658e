#include "nas/index/client.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <cerrno>
#include <span>

#include "nas/base/deadline.h"
#include "nas/index/daemon_socket.h"
#include "nas/index/descriptors.h"
#include "nas/index/frames.h"
#include "nas/system/shares.h"
#include "platform/system.h"

namespace nas {
namespace {

// A state in words; a report of every file system has more.
constexpr size_t kMaxStateBytes = 256;
constexpr char kNoIndex[] = "no index";
constexpr char kBusy[] = "busy";

// The daemon at `path`: its first frame, and the connection where one goes on.
Result<std::string> Ask(const std::string& path, HelloKind kind, char flags, int location_fd,
                        const Deadline& deadline, UniqueFd* connection) {
  auto connected = ConnectToIndex(path, deadline.left_ms());
  if (!connected) return connected.error();
  const Hello hello = {static_cast<char>(kind), flags};
  const std::span<const int> descriptors(&location_fd, location_fd >= 0 ? 1 : 0);
  if (!SendMessage(connected->get(), hello, descriptors)) return ErrnoError(EPIPE, path);
  Frame frame;
  FrameReader reader(connected->get(),
                     kind == HelloKind::kReport ? kMaxAnswerBytes : kMaxStateBytes);
  const FrameReader::State got = reader.Read(deadline.left_ms(), &frame);
  if (got == FrameReader::State::kNotYet) return ErrnoError(EAGAIN, path);
  if (got != FrameReader::State::kFrame || frame.type != FrameType::kStatus) {
    return ErrnoError(EPIPE, path);
  }
  *connection = std::move(*connected);
  return std::move(frame.payload);
}

// A question may take as long as it takes; whoever reads the frames has a bound of their own.
void LiftTimeouts(int connection) {
  const timeval none = {};
  setsockopt(connection, SOL_SOCKET, SO_SNDTIMEO, &none, sizeof none);
  setsockopt(connection, SOL_SOCKET, SO_RCVTIMEO, &none, sizeof none);
}

IndexAnswer AskAbout(int location_fd, HelloKind kind, char flags) {
  const Deadline deadline(kIndexMilliseconds);
  IndexAnswer answer;
  answer.state = kNoIndex;
  for (const std::string& path : IndexSockets()) {
    auto state = Ask(path, kind, flags, location_fd, deadline, &answer.connection);
    if (state) {
      answer.state = std::move(*state);
      if (answer.state == kIndexCurrent) return answer;
    } else if (state.error().error_number == EAGAIN) {
      answer.state = kBusy;
    }
  }
  answer.connection.Reset();
  return answer;
}

}  // namespace

IndexAnswer AskIndex(int location_fd, bool asks_times) {
  IndexAnswer answer =
      AskAbout(location_fd, HelloKind::kQuestion, asks_times ? kHelloAsksTimes : '\0');
  if (answer.connection) LiftTimeouts(answer.connection.get());
  return answer;
}

IndexAnswer AskToCheck(int location_fd) {
  IndexAnswer answer = AskAbout(location_fd, HelloKind::kCheck, '\0');
  if (answer.connection) LiftTimeouts(answer.connection.get());
  return answer;
}

bool IsIndexed(int location_fd) {
  return AskAbout(location_fd, HelloKind::kCovered, '\0').state == kIndexCurrent;
}

Result<std::string> AskDaemon(HelloKind kind, int timeout_ms) {
  const Deadline deadline(timeout_ms);
  Error failed = ErrnoError(ENOENT);
  for (const std::string& path : IndexSockets()) {
    UniqueFd connection;
    auto answer = Ask(path, kind, '\0', -1, deadline, &connection);
    if (answer) return answer;
    if (failed.error_number == ENOENT) failed = answer.error();
  }
  return failed;
}

}  // namespace nas

int FILEIDXIsShareIndexed(const char* share) {
  const auto found = nas::FindShare(share);
  if (!found) return 0;
  const nas::UniqueFd folder(open((found->root + "/").c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  return folder && nas::IsIndexed(folder.get()) ? 1 : 0;
}
