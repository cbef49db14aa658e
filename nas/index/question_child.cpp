#include "nas/index/question_child.h"

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <malloc.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>

#include "nas/base/paths.h"
#include "nas/index/client.h"
#include "nas/index/frames.h"
#include "nas/index/mapped_files.h"
#include "nas/system/child.h"
#include "nas/system/config.h"
#include "nas/system/memory.h"

namespace nas {
namespace {

constexpr int kConnection = 3;
constexpr int kLocation = 4;
// Set in tests, whose sanitizers report there (system/child.cpp).
constexpr char kKeepStandardError[] = "ARBORY_CHILD_STDERR";
// A peer sends its question at once, and takes rows or has stopped.
constexpr time_t kQuestionSeconds = 10;
constexpr time_t kStallSeconds = 60;

// Two descriptors under numbers of their own, the standard streams, and nothing else.
bool KeepOnly(const Question& question) {
  constexpr int kAbove = 64;  // out of the way of both numbers
  const int connection = fcntl(question.connection, F_DUPFD_CLOEXEC, kAbove);
  const int location = fcntl(question.location, F_DUPFD_CLOEXEC, kAbove);
  const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (connection < 0 || location < 0 || null < 0) return false;
  const bool keep_error = std::getenv(kKeepStandardError) != nullptr;
  for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (standard == STDERR_FILENO && keep_error) continue;
    if (null == standard ? fcntl(null, F_SETFD, 0) != 0 : dup2(null, standard) < 0) return false;
  }
  return dup3(connection, kConnection, O_CLOEXEC) >= 0 &&
         dup3(location, kLocation, O_CLOEXEC) >= 0 && close_range(kLocation + 1, ~0U, 0) == 0;
}

void Bound() {
  const IndexSettings& settings = CurrentConfig().index;
  LimitMemory(Config::Megabytes(settings.question_memory_mb));
  const auto seconds = static_cast<rlim_t>(settings.question_seconds);
  const rlimit time = {seconds, seconds};
  setrlimit(RLIMIT_CPU, &time);
  const rlimit nothing = {0, 0};
  setrlimit(RLIMIT_CORE, &nothing);
  setrlimit(RLIMIT_FSIZE, &nothing);
  const timeval question = {kQuestionSeconds, 0};
  const timeval stall = {kStallSeconds, 0};
  setsockopt(kConnection, SOL_SOCKET, SO_RCVTIMEO, &question, sizeof question);
  setsockopt(kConnection, SOL_SOCKET, SO_SNDTIMEO, &stall, sizeof stall);
}

// Of root's rights only those to read.
bool KeepReadingOnly() {
  __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
  std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3> sets = {};
  if (syscall(SYS_capget, &header, sets.data()) != 0) return false;
  const std::uint32_t reading = (1U << CAP_DAC_READ_SEARCH) | (1U << CAP_DAC_OVERRIDE);
  for (size_t at = 0; at < sets.size(); ++at) {
    sets[at].permitted &= at == 0 ? reading : 0;
    sets[at].effective = sets[at].permitted;
    sets[at].inheritable = 0;
  }
  return syscall(SYS_capset, &header, sets.data()) == 0;
}

[[noreturn]] void Answer(const Question& question, const NameTable& table, Changes& changes,
                         bool attributes_current, const AnswerFunction& answer) {
  ResetSignals();
  OfferToOutOfMemoryKiller();
  const bool mappings_known =
      !attributes_current || !question.asks_times || AddMappedInodes(changes);
  const bool ready = KeepOnly(question) && BecomePeer(question.peer).ok();
  if (ready) {
    Bound();
    try {
      if (SendFrame(kConnection, FrameType::kStatus, kIndexCurrent)) {
        answer(kConnection, UniqueFd(kLocation),
               {table, changes, attributes_current, mappings_known});
      }
    } catch (...) {
      // The peer sees a connection that ends before its answer does, and walks.
    }
  }
  _exit(ready ? EXIT_SUCCESS : EXIT_FAILURE);
}

}  // namespace

Status BecomePeer(const Peer& peer) {
  prctl(PR_SET_DUMPABLE, 0);
  if (geteuid() == 0) {
    if (setgroups(peer.groups.size(), peer.groups.data()) != 0 ||
        setresgid(peer.gid, peer.gid, peer.gid) != 0 ||
        setresuid(peer.uid, peer.uid, peer.uid) != 0) {
      return ErrnoError();
    }
    if (peer.uid == 0 && !KeepReadingOnly()) return ErrnoError();
  } else if (peer.uid != geteuid()) {
    return ErrnoError(EPERM);
  }
  // A change of ids has set it anew.
  if (prctl(PR_SET_DUMPABLE, 0) != 0 || prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    return ErrnoError();
  }
  if (peer.uid != 0 && (setuid(0) == 0 || geteuid() != peer.uid)) return ErrnoError(EPERM);
  return {};
}

pid_t StartQuestion(const Question& question, const NameTable& table, Changes& changes,
                    bool attributes_current, const AnswerFunction& answer) {
  // What lies free in pieces is brought together here, once; each child would do so in a copy, page
  // by page, which is a twentieth of what a hundred rows of many take.
  malloc_trim(0);
  const pid_t pid = fork();
  if (pid == 0) Answer(question, table, changes, attributes_current, answer);
  return pid;
}

}  // namespace nas
