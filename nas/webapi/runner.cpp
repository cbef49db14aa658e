#include "nas/webapi/runner.h"

#include <malloc.h>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <string_view>
#include <utility>

#include "nas/base/accounts.h"
#include "nas/base/json_text.h"
#include "nas/base/sqlite.h"
#include "nas/base/system_call.h"
#include "nas/system/config.h"
#include "nas/webapi/request_child.h"

namespace nas {
namespace {

constexpr size_t kReadBytes = size_t{64} << 10;
// Room taken at once on the word of a length; more only as bytes come.
constexpr std::uint64_t kMaxReserve = std::uint64_t{64} << 20;
constexpr int kForever = -1;
// Of a reply's text, held at once. A page that a person looks at is far shorter.
constexpr size_t kSpoolBytes = size_t{1} << 20;

// A reply as it comes in.
class Incoming {
 public:
  // Reads once. False where no more is wanted or can come.
  bool ReadSome(int fd) {
    buffer_.resize(kReadBytes);
    const ssize_t count = read(fd, buffer_.data(), buffer_.size());
    if (count < 0) return errno == EINTR;
    return count > 0 && Take(std::string_view(buffer_).substr(0, static_cast<size_t>(count)));
  }
  bool whole() const { return begun_ && reply_.body.size() == reader_.body_bytes(); }
  // Of a whole one, once.
  Reply Take() { return std::move(reply_); }

 private:
  bool Take(std::string_view bytes) {
    if (!begun_) {
      const auto state = reader_.Feed(bytes);
      if (state != ReplyReader::State::kReady) return state == ReplyReader::State::kMore;
      begun_ = true;
      reply_.head = reader_.head();
      reply_.body.reserve(std::min(reader_.body_bytes(), kMaxReserve));
      bytes = reader_.body_begin();
    }
    const std::uint64_t missing = reader_.body_bytes() - reply_.body.size();
    reply_.body.append(bytes.substr(0, std::min<std::uint64_t>(missing, bytes.size())));
    return !whole();
  }

  std::string buffer_;
  ReplyReader reader_;
  bool begun_ = false;
  Reply reply_;
};

// Collects the reply. What the child wrote before it died is still read.
void Collect(const Child& child, int process_fd, Incoming* incoming) {
  for (bool dead = false;;) {
    pollfd watched[] = {{child.fd.get(), POLLIN, 0}, {process_fd, POLLIN, 0}};
    const int ready = poll(watched, process_fd < 0 || dead ? 1 : 2, dead ? 0 : kForever);
    if (ready < 0 && errno == EINTR) continue;
    if (ready < 0 || (dead && ready == 0)) return;
    if (watched[0].revents == 0) {
      dead = watched[1].revents != 0;
    } else if (!incoming->ReadSome(child.fd.get())) {
      return;
    }
  }
}

void Reap(pid_t child) {
  Uninterrupted([=] { return waitpid(child, nullptr, 0); });
}

}  // namespace

Reply EncodeJsonReply(int code, const Json::Value& data) {
  Reply reply{{.code = code}, "{\"code\":" + std::to_string(code) + ",\"data\":"};
  std::shared_ptr<Spool> spool;
  size_t most = kSpoolBytes;
  AppendJson(data, JsonBytes::kClean, &reply.body, [&](std::string* text) {
    if (text->size() < most || SpoolFolder().empty()) return;
    if (!spool) spool = std::make_shared<Spool>(SpoolFolder());
    if (spool->Append(*text)) {
      text->clear();
    } else {
      most = 2 * text->size();  // no place on the disk: held as far as the call's memory goes
    }
  });
  reply.body += '}';
  reply.beginning = spool && spool->bytes() > 0 ? std::move(spool) : nullptr;
  return reply;
}

void PrepareForCalls() {
  // What is freed goes back to its neighbours at once. Otherwise each child's first large request
  // for memory would gather all small pieces that this process has freed, and so get a copy of its
  // own of the pages that they lie on.
  mallopt(M_MXFAST, 0);
  LoadNameService();
  LoadSqlite();
}

Child StartCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode) {
  return StartChild(
      [&](int pipe) {
        const pid_t self = getpid();
        Reply reply = ServeCall(row, call, encode);
        if (getpid() != self) return;
        if (call.finish) reply = call.finish(std::move(reply));
        // What a long page was made of is free by now, and a client may take its time.
        if (reply.beginning) malloc_trim(0);
        SendReply(pipe, reply);
      },
      CurrentConfig().call_memory_bytes());
}

Reply FinishCall(Child child, const ReplyEncoder& encode, ChildsEnd end) {
  Incoming incoming;
  if (child.pid > 0) {
    const UniqueFd process(static_cast<int>(syscall(SYS_pidfd_open, child.pid, 0)));
    Collect(child, process.get(), &incoming);
    child.fd.Reset();
    if (end == ChildsEnd::kAwaited) Reap(child.pid);
  }
  return incoming.whole() ? incoming.Take() : encode(kCodeUnknownFailure, Json::Value());
}

Reply RunCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode) {
  return FinishCall(StartCall(row, call, encode), encode);
}

}  // namespace nas
