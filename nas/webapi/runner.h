#pragma once
// Runs one API call as the web API server does: finds the table row, forks a request child, calls
// the row's entry function there and receives one reply.
//
// Protocol between child and caller: a pipe, on which the child writes one frame, a 64-bit
// length in host order and that many bytes of payload. The caller takes the first whole frame and
// ignores what follows. Only the request child itself writes: what a worker leaves in its copy of
// the response, when it falls back into the request's path, is dropped, as two writers of large
// frames would tear each other's. A child that ends without a whole frame gives no reply.
//
// The child closes every inherited descriptor but the pipe, has /dev/null as its standard streams,
// default signal handlers, a process group of its own (a terminal's interrupt must not cut down a
// call that is about to tell a search's id) and the caller's identity; the module switches to the
// user. A search worker that the call forks lives on after the child.

#include <sys/types.h>

#include <functional>
#include <string>
#include <utility>

#include "nas/base/unique_fd.h"
#include "platform/webapi.h"

namespace nas {

// A module, loaded for the rest of the process.
class Module {
 public:
  // Loads the module at `path`; empty: the configured one, or the one beside the program. Throws
  // std::runtime_error naming the file and the trouble.
  explicit Module(const std::string& path);

  // The row that serves the method: api and version exactly, the method ignoring letter case (a
  // client reaches clean-all by the method "Clean" with "action" = "cleanall"). Null when none
  // matches.
  const NUVA::APIMethod* Find(const std::string& api, int version, const std::string& method) const;
  // The table; ends with a row whose api is null.
  const NUVA::APIMethod* table() const { return table_; }

 private:
  const NUVA::APIMethod* table_ = nullptr;
};

struct ApiCall {
  std::string method;  // as the client spelled it
  Json::Value params;  // an object, or null for none
  std::string user;
  std::string session;
};

// Turns the reply into the bytes that are sent. Runs in the request child, so that a caller that
// needs only part of a large reply need not ship the rest of it. Called when the entry function
// sets its reply, so that a large one is not copied first.
using ReplyEncoder = std::function<std::string(int code, const Json::Value& data)>;
// {"code":N,"data":...} in one line of valid UTF-8, without a newline.
std::string EncodeJsonReply(int code, const Json::Value& data);

constexpr int kCodeUnknownFailure = 100;  // an exception or a death inside the call

// A request child at work. For event loops: watch fd() and feed what it yields to a FrameReader.
struct RunningCall {
  pid_t pid = -1;
  UniqueFd fd;  // readable end of the pipe, non-blocking not set
};
// Forks the request child. pid is -1 with errno set when that fails.
RunningCall StartCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode);

// Collects one frame.
class FrameReader {
 public:
  // Takes bytes as they come. True once the frame is whole; later bytes are ignored.
  bool Feed(const char* bytes, size_t count);
  bool whole() const { return whole_; }
  // Of a whole frame; once.
  std::string TakePayload() { return std::move(payload_); }

 private:
  std::string header_;
  std::string payload_;
  unsigned long long expected_ = 0;
  bool whole_ = false;
};

// Makes the call and waits for its reply and for the end of the request child. A call that cannot
// be made or answers nothing yields encode(kCodeUnknownFailure, null).
std::string RunCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode);

// The second half of RunCall, for a call begun with StartCall. `go_on`, where given, is asked every
// kAskMilliseconds while the call is waited for; when it answers false the request child is killed
// and the result is empty.
constexpr int kAskMilliseconds = 50;  // soon enough for a person's interrupt
std::string FinishCall(RunningCall running, const ReplyEncoder& encode,
                       const std::function<bool()>& go_on = {});
// Ends a call that nobody waits for any more.
void AbandonCall(RunningCall running);

}  // namespace nas
