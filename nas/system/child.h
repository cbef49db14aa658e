#pragma once
// Forking a child that gives one answer, and how the answer travels.
//
// What may go wrong in a child: the code it runs is a module's or PAM's, it acts for a client who
// chose its parameters, and it may fork a worker that lives for hours. So the child
//
//   - has only the standard streams (/dev/null) and its pipe open: no client's connection, no
//     listening socket, no other child's pipe;
//   - has default signal handlers, none masked, SIGPIPE and SIGXFSZ ignored, so that a caller that
//     has gone and a file that may not grow show as a failed write and do not end a worker;
//   - has a process group of its own: a terminal's interrupt must not cut down a call that is about
//     to tell a search's id;
//   - is among the first to go where the machine runs out of memory, and so is what it forks;
//   - has seen no failure: the last platform error is none;
//   - never returns into its parent's code, whatever is thrown: it ends by _exit, since exit
//     handlers and buffered output are the parent's.
//
// It keeps the parent's identity; whoever acts for a user becomes that user first (identity.h).
//
// Protocol, on a pipe from the child to its parent: one frame,
//
//   a 64-bit number        bytes that follow, in host order; all ones: as many as come until the
//                          child ends, for a body that tells its own end
//   STATUS CODE\n          HTTP status, and the API's code
//   Name: value\n          fields, any number; neither part holds a line's end, the name no ": "
//   \n
//   body                   the rest of the frame
//
// The head tells what the parent must know, so that a server can pass the body on, however large,
// without looking into it. The parent takes the first frame and ignores what follows. Only the
// child itself may write: a worker's copy of a reply would tear it. A child that ends before its
// frame is whole has failed; the pipe's end does not tell that, as a worker may hold the pipe open,
// but the process's does.

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "nas/base/spool.h"
#include "nas/base/unique_fd.h"

namespace nas {

struct ReplyHead {
  int status = 200;  // of HTTP, for callers that speak it
  int code = 0;      // of the API; 0 is success
  std::vector<std::pair<std::string, std::string>> fields = {};
};

struct Reply {
  ReplyHead head;
  std::string body;
  std::shared_ptr<const Spool> beginning = nullptr;  // of the body, where that is long
};

// A child at work. Whoever holds it reaps it. For event loops: watch fd and feed what it yields to
// a ReplyReader.
struct Child {
  pid_t pid = -1;  // -1, with errno set, where none could be had
  UniqueFd fd;     // readable end of the pipe, O_NONBLOCK not set
};

// Forks a child that runs `body` and ends. `pipe` is the writable end. With `memory_bytes` the
// child cannot take more memory of its own than that (LimitMemory); 0: no bound. For a process of
// one thread.
Child StartChild(const std::function<void(int pipe)>& body, std::uint64_t memory_bytes = 0);
// The same with a connection (SOCK_SEQPACKET) in the place of the pipe, for a child that answers
// more than once: it ends when the other end is closed everywhere.
Child StartAnsweringChild(const std::function<void(int connection)>& body);

// What StartChild does to its children, for those that are made otherwise: default handlers and an
// empty mask, SIGPIPE and SIGXFSZ ignored; and to be among the first to go where memory runs out,
// which is to be said before a process of root's becomes a user's.
void ResetSignals();
void OfferToOutOfMemoryKiller();

// The length of a body that goes on until the child ends.
inline constexpr std::uint64_t kUntilEnd = UINT64_MAX;

// For the child. False when the parent has gone, which nobody needs to be told.
bool SendReply(int pipe, const Reply& reply);
// Sends the frame's beginning; `body_bytes` more must follow, or any number for kUntilEnd.
bool SendHead(int pipe, const ReplyHead& head, std::uint64_t body_bytes);

// Collects a child's frame up to where the body begins.
class ReplyReader {
 public:
  enum class State { kMore, kReady, kBroken };
  // Takes bytes as they come, until they are enough.
  State Feed(std::string_view bytes);

  const ReplyHead& head() const { return head_; }
  std::uint64_t body_bytes() const { return body_bytes_; }
  // What came of the body together with the head.
  std::string_view body_begin() const { return std::string_view(bytes_).substr(body_at_); }

 private:
  State Parse();

  std::string bytes_;
  ReplyHead head_;
  std::uint64_t body_bytes_ = 0;
  size_t body_at_ = 0;
};

}  // namespace nas
