// Asking over HTTP/1.1 by libcurl's multi interface, which is told of the sockets that epoll names:
// a look at each of a thousand connections whenever one has something to say would be most of the
// work.

#include "nas/fleet/plugin/client.h"

#include <curl/curl.h>
#include <sys/epoll.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <iterator>
#include <map>
#include <memory>
#include <optional>
#include <utility>

#include "nas/base/unique_fd.h"

namespace nas {
namespace {

// Bounds how long Run takes to see its stop flag.
constexpr std::chrono::milliseconds kTick(25);
// Sockets that are looked at in one turn.
constexpr int kEvents = 64;
// What a machine may keep silent in the midst of a body that is passed on: a disk may spin up.
constexpr std::chrono::seconds kMostSilence(30);
// Of all replies that are being read. What is over goes at the expense of those that have more of
// it than their part, so that machines that send without end take little from one that does not.
constexpr size_t kMostHeldBytes = size_t{16} << 20;
// A thousand connections are read at a time; the usual buffers would be most of what that takes.
constexpr long kBufferBytes = 4096;
constexpr int kOk = 200;
constexpr int kPartial = 206;
constexpr int kNotSatisfiable = 416;

using Clock = std::chrono::steady_clock;

struct EasyEnd {
  void operator()(CURL* easy) const { curl_easy_cleanup(easy); }
};
struct ListEnd {
  void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};

// What all replies hold that are being read.
struct Held {
  size_t replies = 0;
  size_t bytes = 0;
};

// One request under way.
struct Exchange {
  ~Exchange() {
    if (held == nullptr) return;
    --held->replies;
    held->bytes -= holds;
  }
  std::unique_ptr<CURL, EasyEnd> easy{curl_easy_init()};
  std::unique_ptr<curl_slist, ListEnd> fields;
  std::string body;  // sent
  FleetReply reply;
  size_t most_bytes = 0;
  Held* held = nullptr;
  size_t holds = 0;  // of that
  FleetClient::Done done;
  // Of a body that is passed on.
  std::function<bool(const FleetHead&)> take_head;
  std::function<bool(std::string_view)> take_piece;
  bool head_taken = false;
  Clock::time_point patience_ends;

  int status() const {
    long status = 0;
    curl_easy_getinfo(easy.get(), CURLINFO_RESPONSE_CODE, &status);
    return static_cast<int>(status);
  }
  bool passed_on() const {
    if (!take_head) return false;
    const int is = status();
    return is == kOk || is == kPartial || is == kNotSatisfiable;
  }
  bool TakeHead();
};

bool Exchange::TakeHead() {
  if (std::exchange(head_taken, true)) return true;
  FleetHead head;
  head.status = status();
  curl_off_t length = -1;
  curl_off_t modified = -1;
  curl_easy_getinfo(easy.get(), CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &length);
  curl_easy_getinfo(easy.get(), CURLINFO_FILETIME_T, &modified);
  head.length = length;
  head.modified = modified;
  curl_header* range = nullptr;
  if (curl_easy_header(easy.get(), "Content-Range", 0, CURLH_HEADER, -1, &range) == CURLHE_OK) {
    head.range = range->value;
  }
  return take_head(head);
}

size_t PassOn(Exchange& exchange, std::string_view piece) {
  const bool taken =
      exchange.TakeHead() && (exchange.status() == kNotSatisfiable || exchange.take_piece(piece));
  // Whoever takes the pieces may be slow, which is not the machine's silence.
  exchange.patience_ends = Clock::now() + kMostSilence;
  return taken ? piece.size() : 0;
}

bool MayHold(Exchange& exchange, size_t more) {
  Held& held = *exchange.held;
  held.bytes += more;
  exchange.holds += more;
  return held.bytes <= kMostHeldBytes || exchange.holds <= kMostHeldBytes / held.replies;
}

size_t TakeBody(char* bytes, size_t size, size_t count, void* context) {
  auto& exchange = *static_cast<Exchange*>(context);
  const size_t length = size * count;
  if (exchange.passed_on()) return PassOn(exchange, {bytes, length});
  if (exchange.reply.body.size() + length > exchange.most_bytes || !MayHold(exchange, length)) {
    exchange.reply.outcome = FleetReply::Outcome::kTooLong;
    return 0;
  }
  exchange.reply.body.append(bytes, length);
  return length;
}

class CurlClient : public FleetClient {
 public:
  CurlClient(std::string socket, size_t most_bytes);
  ~CurlClient() override {
    BreakOff();
    curl_multi_cleanup(multi_);
  }
  CurlClient(const CurlClient&) = delete;
  CurlClient& operator=(const CurlClient&) = delete;

  void Ask(const FleetRequest& request, Done done) override;
  void Step() override { Turn(std::chrono::milliseconds(0)); }
  void Run(const std::function<bool()>& stop) override;

 private:
  static int OnSocket(CURL* easy, curl_socket_t socket, int wanted, void* context, void* known);
  static int OnTimer(CURLM* multi, long milliseconds, void* context);
  void Turn(std::chrono::milliseconds most_wait);
  void TakeEnded();
  void EndSilent();
  void BreakOff();

  const std::string socket_;
  const size_t most_bytes_;
  const UniqueFd epoll_;
  CURLM* const multi_;
  std::optional<Clock::time_point> due_;  // for the library to look at its own times
  Held held_;                             // before what counts in it
  std::map<CURL*, std::unique_ptr<Exchange>> under_way_;
  size_t passed_on_ = 0;  // of those, whose bodies are passed on
};

CurlClient::CurlClient(std::string socket, size_t most_bytes)
    : socket_(std::move(socket)),
      most_bytes_(most_bytes),
      epoll_(epoll_create1(EPOLL_CLOEXEC)),
      multi_(curl_multi_init()) {
  curl_multi_setopt(multi_, CURLMOPT_SOCKETFUNCTION, OnSocket);
  curl_multi_setopt(multi_, CURLMOPT_SOCKETDATA, this);
  curl_multi_setopt(multi_, CURLMOPT_TIMERFUNCTION, OnTimer);
  curl_multi_setopt(multi_, CURLMOPT_TIMERDATA, this);
}

int CurlClient::OnSocket(CURL* /*easy*/, curl_socket_t socket, int wanted, void* context,
                         void* known) {
  const auto& self = *static_cast<CurlClient*>(context);
  if (wanted == CURL_POLL_REMOVE) {
    epoll_ctl(self.epoll_.get(), EPOLL_CTL_DEL, socket, nullptr);
    return 0;
  }
  epoll_event event = {};
  event.data.fd = socket;
  if ((wanted & CURL_POLL_IN) != 0) event.events |= EPOLLIN;
  if ((wanted & CURL_POLL_OUT) != 0) event.events |= EPOLLOUT;
  epoll_ctl(self.epoll_.get(), known == nullptr ? EPOLL_CTL_ADD : EPOLL_CTL_MOD, socket, &event);
  if (known == nullptr) curl_multi_assign(self.multi_, socket, context);
  return 0;
}

int CurlClient::OnTimer(CURLM* /*multi*/, long milliseconds, void* context) {
  auto& self = *static_cast<CurlClient*>(context);
  self.due_.reset();
  if (milliseconds >= 0) self.due_ = Clock::now() + std::chrono::milliseconds(milliseconds);
  return 0;
}

void CurlClient::Ask(const FleetRequest& request, Done done) {
  auto exchange = std::make_unique<Exchange>();
  CURL* easy = exchange->easy.get();
  exchange->body = request.body;
  exchange->most_bytes = most_bytes_;
  exchange->held = &held_;
  ++held_.replies;
  exchange->done = std::move(done);
  const auto add = [&](const std::string& field) {
    curl_slist* longer = curl_slist_append(exchange->fields.get(), field.c_str());
    (void)exchange->fields.release();
    exchange->fields.reset(longer);
  };
  add("Authorization: Arbory-Fleet " + request.token);
  if (!request.host.empty()) add("Host: " + request.host);
  add("Expect:");
  if (request.method == "POST") {
    add("Content-Type: application/json");
    curl_easy_setopt(easy, CURLOPT_POSTFIELDS, exchange->body.data());
    curl_easy_setopt(easy, CURLOPT_POSTFIELDSIZE_LARGE,
                     static_cast<curl_off_t>(exchange->body.size()));
  }
  curl_easy_setopt(easy, CURLOPT_URL, (request.address + request.target).c_str());
  curl_easy_setopt(easy, CURLOPT_PATH_AS_IS, 1L);
  if (!socket_.empty()) curl_easy_setopt(easy, CURLOPT_UNIX_SOCKET_PATH, socket_.c_str());
  curl_easy_setopt(easy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
  curl_easy_setopt(easy, CURLOPT_PROTOCOLS_STR, "http,https");
  curl_easy_setopt(easy, CURLOPT_PROXY, "");  // whatever the environment says
  curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
  if (request.take_head) {
    exchange->take_head = request.take_head;
    exchange->take_piece = request.take_piece;
    exchange->patience_ends = Clock::now() + std::chrono::milliseconds(request.deadline_ms);
    curl_easy_setopt(easy, CURLOPT_FILETIME, 1L);
    ++passed_on_;
  } else {
    curl_easy_setopt(easy, CURLOPT_TIMEOUT_MS, static_cast<long>(request.deadline_ms));
    curl_easy_setopt(easy, CURLOPT_BUFFERSIZE, kBufferBytes);
  }
  if (request.method == "HEAD") curl_easy_setopt(easy, CURLOPT_NOBODY, 1L);
  curl_easy_setopt(easy, CURLOPT_HTTPHEADER, exchange->fields.get());
  curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, TakeBody);
  curl_easy_setopt(easy, CURLOPT_WRITEDATA, exchange.get());
  curl_multi_add_handle(multi_, easy);
  under_way_.emplace(easy, std::move(exchange));
}

void CurlClient::Run(const std::function<bool()>& stop) {
  while (!stop() && !under_way_.empty()) Turn(kTick);
  BreakOff();
}

void CurlClient::Turn(std::chrono::milliseconds most_wait) {
  auto wait = most_wait;
  if (due_) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*due_ - Clock::now());
    wait = std::clamp(left, std::chrono::milliseconds(0), most_wait);
  }
  std::array<epoll_event, kEvents> events;
  const int count =
      epoll_wait(epoll_.get(), events.data(), kEvents, static_cast<int>(wait.count()));
  int running = 0;
  for (int i = 0; i < count; ++i) {
    const std::uint32_t is = events[static_cast<size_t>(i)].events;
    int ready = 0;
    if ((is & EPOLLIN) != 0) ready |= CURL_CSELECT_IN;
    if ((is & EPOLLOUT) != 0) ready |= CURL_CSELECT_OUT;
    if ((is & (EPOLLERR | EPOLLHUP)) != 0) ready |= CURL_CSELECT_ERR;
    curl_multi_socket_action(multi_, events[static_cast<size_t>(i)].data.fd, ready, &running);
  }
  if (due_ && *due_ <= Clock::now()) {
    due_.reset();
    curl_multi_socket_action(multi_, CURL_SOCKET_TIMEOUT, 0, &running);
  }
  TakeEnded();
  if (passed_on_ > 0) EndSilent();
}

void CurlClient::TakeEnded() {
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(multi_, &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    const CURLcode result = message->data.result;
    const auto ended = under_way_.extract(message->easy_handle);
    curl_multi_remove_handle(multi_, ended.key());
    Exchange& exchange = *ended.mapped();
    if (exchange.take_head) --passed_on_;
    FleetReply& reply = exchange.reply;
    if (result == CURLE_OK && (!exchange.passed_on() || exchange.TakeHead())) {
      reply.outcome = FleetReply::Outcome::kReply;
      reply.status = exchange.status();
    } else if (reply.outcome != FleetReply::Outcome::kTooLong) {
      reply.outcome = result == CURLE_OPERATION_TIMEDOUT ? FleetReply::Outcome::kLate
                                                         : FleetReply::Outcome::kDown;
    }
    exchange.done(std::move(reply));
  }
}

void CurlClient::EndSilent() {
  const Clock::time_point now = Clock::now();
  for (auto at = under_way_.begin(); at != under_way_.end();) {
    const auto next = std::next(at);
    if (at->second->take_head && now > at->second->patience_ends) {
      const auto ended = under_way_.extract(at);
      curl_multi_remove_handle(multi_, ended.key());
      --passed_on_;
      ended.mapped()->reply.outcome = FleetReply::Outcome::kLate;
      ended.mapped()->done(std::move(ended.mapped()->reply));
    }
    at = next;
  }
}

void CurlClient::BreakOff() {
  for (const auto& [easy, exchange] : under_way_) curl_multi_remove_handle(multi_, easy);
  under_way_.clear();
  passed_on_ = 0;
}

}  // namespace

// Again and again does no more than count.
void PrepareFleetClient() { curl_global_init(CURL_GLOBAL_DEFAULT); }

FleetClient* NewFleetClient(const std::string& socket, size_t most_bytes) {
  PrepareFleetClient();
  return new CurlClient(socket, most_bytes);
}

}  // namespace nas
