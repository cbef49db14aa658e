#include "arbory/server/transport/http_server.h"

#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/signal_set.hpp>
#include <boost/asio/steady_timer.hpp>
#include <charconv>
#include <map>
#include <set>
#include <stdexcept>
#include <tuple>
#include <unordered_map>

#include "arbory/server/transport/addresses.h"
#include "arbory/server/transport/child_pipe.h"
#include "arbory/server/transport/children.h"
#include "arbory/server/transport/connection.h"
#include "nas/base/unique_fd.h"

namespace arbory {
namespace {

namespace asio = boost::asio;
using asio::ip::tcp;
using Error = boost::system::error_code;

// Between two looks at who is left.
constexpr std::chrono::milliseconds kStopPause{20};
// After a failed accept, when the machine is short of descriptors or memory.
constexpr std::chrono::milliseconds kAcceptPause{100};

constexpr std::chrono::seconds kErrandPause{1};

constexpr int kThreads = 1;  // a process of several could not fork safely

tcp::endpoint ParseAddress(const std::string& text) {
  const size_t colon = text.rfind(':');
  std::string host = text.substr(0, colon == std::string::npos ? 0 : colon);
  const std::string port = text.substr(colon == std::string::npos ? 0 : colon + 1);
  if (host.starts_with('[') && host.ends_with(']')) host = host.substr(1, host.size() - 2);
  if (host == "localhost") host = "127.0.0.1";
  std::uint16_t number = 0;
  const auto parsed = std::from_chars(port.data(), port.data() + port.size(), number);
  Error error;
  const auto address = asio::ip::make_address(host, error);
  if (error || parsed.ec != std::errc() || parsed.ptr != port.data() + port.size()) {
    throw std::runtime_error("'" + text +
                             "' is no address to listen on; give one like 127.0.0.1:8750");
  }
  return {address, number};
}

std::string AddressText(const tcp::endpoint& endpoint) {
  std::string address = endpoint.address().to_string();
  if (endpoint.address().is_unspecified()) address = OwnAddress(address);
  const std::string host = address.find(':') == std::string::npos ? address : "[" + address + "]";
  return host + ":" + std::to_string(endpoint.port());
}

}  // namespace

class HttpServer::Loop : public ConnectionHost {
 public:
  explicit Loop(const nas::ServerSettings& settings)
      : settings_(settings),
        proxies_(settings.proxies),
        loop_(kThreads),
        acceptor_(loop_),
        accept_pause_(loop_),
        errand_timer_(loop_),
        stop_timer_(loop_),
        stop_signals_(loop_, SIGTERM, SIGINT),
        child_signals_(loop_, SIGCHLD),
        hangup_signals_(loop_) {
    Listen(ParseAddress(settings.listen));
  }
  ~Loop() override { stopping_ = false; }  // connections that end now are nobody's wait

  void Run(HttpService* service) {
    service_ = service;
    signal(SIGPIPE, SIG_IGN);
    // Search workers outlive the child that started them; as this process's own they are reaped.
    prctl(PR_SET_CHILD_SUBREAPER, 1);
    // Where nothing else is done at a hang-up, it must not end the server without its workers.
    Error ignored;
    if (!on_hangup_) stop_signals_.add(SIGHUP, ignored);
    stop_signals_.async_wait([this](Error error, int) {
      if (!error) BeginStop();
    });
    RunLoop();
    StopWorkers();
  }

  void OnHangup(std::function<void()> action) {
    if (action) on_hangup_ = std::move(action);
    Error ignored;
    hangup_signals_.add(SIGHUP, ignored);
    hangup_signals_.async_wait([this](Error error, int) {
      if (error) return;
      on_hangup_();
      OnHangup(nullptr);
    });
  }

  tcp::endpoint endpoint() const { return endpoint_; }
  const std::string& address() const { return address_; }
  ServerCounts counts() const { return {connections_.size(), children_.size()}; }

  asio::io_context& loop() override { return loop_; }
  const nas::ServerSettings& settings() const override { return settings_; }
  const Proxies& proxies() const override { return proxies_; }
  HttpService& service() override { return *service_; }
  bool stopping() const override { return stopping_; }
  Turns& turns() override { return turns_; }

  std::shared_ptr<ChildPipe> Adopt(ChildAnswer* answer) override {
    auto pipe =
        std::make_shared<ChildPipe>(loop_, std::move(answer->child), std::move(answer->token),
                                    std::chrono::seconds(settings_.call_seconds));
    children_[pipe->pid()] = pipe;
    return pipe;
  }

  void Closed(Connection* connection) override {
    connections_.erase(connection);
    if (stopping_) EndWhenIdle();
  }

 private:
  void Listen(const tcp::endpoint& wanted) {
    try {
      acceptor_.open(wanted.protocol());
      acceptor_.set_option(tcp::acceptor::reuse_address(true));
      acceptor_.bind(wanted);
      acceptor_.listen(asio::socket_base::max_listen_connections);
      acceptor_.native_non_blocking(true);
      endpoint_ = acceptor_.local_endpoint();
    } catch (const boost::system::system_error& error) {
      throw std::runtime_error("cannot listen on " + AddressText(wanted) + ": " +
                               error.code().message() + "; give another address with --listen");
    }
    address_ = AddressText(endpoint_);
  }

  // What a request throws, for want of memory or of a place to watch its socket, ends that request
  // with its connection. The server goes on once it can wait for clients and children again.
  void RunLoop() {
    while (!TryRun([this] {
      Prepare();
      loop_.run();
    })) {
      usleep(std::chrono::microseconds(kAcceptPause).count());
      // Nobody is left waiting where not even the preparing is possible: what is under way goes on
      // or ends, and who comes finds the connection closed.
      if (TryRun([this] { Prepare(); })) continue;
      TryRun([this] { loop_.poll(); });
      loop_.restart();
      TurnAway();
    }
  }

  void Prepare() {
    if (!awaiting_children_) AwaitChildren();
    Reap();  // also those whose signal came to nothing
    if (!accepting_ && !stopping_) Accept();
    turns_.Continue();
  }

  template <typename Step>
  bool TryRun(Step step) {
    try {
      step();
      return true;
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "a request was dropped: %s", error.what());
      return false;
    }
  }

  // Takes no memory.
  void TurnAway() {
    for (;;) {
      const nas::UniqueFd client(
          accept4(acceptor_.native_handle(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
      if (!client) return;
    }
  }

  void Accept() {
    accepting_ = false;
    acceptor_.async_accept([this](Error error, tcp::socket socket) {
      accepting_ = false;
      if (stopping_) return;
      if (error) return AcceptLater();
      // Where nobody has to go for it, one client more than allowed finds its connection closed.
      if (connections_.size() < static_cast<size_t>(settings_.max_connections) ||
          MakeRoom(socket)) {
        const auto connection = std::make_shared<Connection>(this, std::move(socket));
        connections_.insert(connection.get());
        connection->Start();
        if (!errands_wait_) AwaitErrands();
      }
      Accept();
    });
    accepting_ = true;
  }

  // Ends a connection that waits for its client, of the client with most of them. Nobody goes for
  // one who would then have more, but each client's own idle ones go for its new ones.
  bool MakeRoom(const tcp::socket& socket) {
    Error error;
    const auto peer = socket.remote_endpoint(error);
    if (error) return false;
    std::map<std::string, size_t> counts;
    for (const Connection* each : connections_) {
      if (each->stage() != Connection::Stage::kEnded) ++counts[each->network()];
    }
    const std::string newcomer = NetworkOf(peer.address().to_string());
    const auto rank = [&](const Connection* each) {
      return std::make_tuple(counts[each->network()], each->stage() == Connection::Stage::kIdle,
                             -each->since().time_since_epoch());
    };
    Connection* chosen = nullptr;
    for (Connection* each : connections_) {
      const bool idle = each->stage() == Connection::Stage::kIdle;
      if (!idle && each->stage() != Connection::Stage::kReading) continue;
      const bool own = each->network() == newcomer;
      if (own ? !idle : counts[each->network()] <= counts[newcomer]) continue;
      if (chosen == nullptr || rank(each) > rank(chosen)) chosen = each;
    }
    const auto alive = chosen == nullptr ? nullptr : chosen->weak_from_this().lock();
    if (alive) alive->Abort();
    return alive != nullptr;
  }

  void AcceptLater() {
    accept_pause_.expires_after(kAcceptPause);
    accept_pause_.async_wait([this](Error error) {
      accepting_ = false;
      if (!error && !stopping_) Accept();
    });
    accepting_ = true;
  }

  void AwaitChildren() {
    child_signals_.async_wait([this](Error error, int) {
      awaiting_children_ = false;
      if (error) return;
      Reap();
      AwaitChildren();
    });
    awaiting_children_ = true;
  }

  void Reap() {
    pid_t pid;
    while ((pid = waitpid(-1, nullptr, WNOHANG)) > 0) {
      const auto found = children_.find(pid);
      if (found == children_.end()) continue;  // a search worker
      const auto child = std::move(found->second);
      children_.erase(found);
      child->OnExit();
    }
    if (stopping_) EndWhenIdle();
  }

  void AwaitErrands() {
    errand_timer_.expires_after(kErrandPause);
    errand_timer_.async_wait([this](Error error) {
      errands_wait_ = false;
      if (error || stopping_) return;
      auto errands = service_->Errands();
      if (errands || !connections_.empty()) AwaitErrands();
      if (!errands) return;
      for (ChildAnswer& errand : *errands) AwaitHead(Adopt(&errand).get(), {errand.make_reply, {}});
    });
    errands_wait_ = true;
  }

  struct Errand {
    std::function<HttpReply(const nas::ReplyHead* head)> done;
    nas::ReplyReader head;
  };
  // The pipe lives while it has somebody to read to, whom it owns.
  static void AwaitHead(ChildPipe* child, Errand errand) {
    child->Read([child, errand = std::move(errand)](std::string_view bytes) mutable {
      const auto state = errand.head.Feed(bytes);
      if (state == nas::ReplyReader::State::kMore && !bytes.empty()) {
        return AwaitHead(child, std::move(errand));
      }
      child->Close();
      errand.done(state == nas::ReplyReader::State::kReady ? &errand.head.head() : nullptr);
    });
  }

  void BeginStop() {
    stopping_ = true;
    Error ignored;
    acceptor_.close(ignored);
    accept_pause_.cancel();
    hangup_signals_.cancel(ignored);
    stop_timer_.expires_after(kFinishTime);
    stop_timer_.async_wait([this](Error error) {
      if (!error) EndNow();
    });
    // Whoever asks twice does not want to wait.
    stop_signals_.async_wait([this](Error error, int) {
      if (!error) EndNow();
    });
    ForEachConnection(&Connection::Stop);
    EndWhenIdle();
  }

  void ForEachConnection(void (Connection::*action)()) {
    const std::set<Connection*> now = connections_;
    for (Connection* connection : now) {
      if (!connections_.contains(connection)) continue;
      const auto alive = connection->weak_from_this().lock();
      if (alive) (alive.get()->*action)();
    }
  }

  void EndNow() {
    for (const auto& [pid, child] : children_) child->Kill();
    ForEachConnection(&Connection::Abort);
    ended_ = true;
    // A child that even this does not end waits for a device, and would do so for ever.
    stop_timer_.expires_after(kStopTime);
    stop_timer_.async_wait([this](Error error) {
      if (!error) loop_.stop();
    });
    EndWhenIdle();
  }

  void EndWhenIdle() {
    if (children_.empty() && (connections_.empty() || ended_)) loop_.stop();
  }

  // Workers appear here when the child that forked them ends, so whoever is left is looked for
  // until nobody is.
  void StopWorkers() {
    std::set<pid_t> told;
    const auto deadline = Clock::now() + kStopTime;
    for (;;) {
      while (waitpid(-1, nullptr, WNOHANG) > 0) {
      }
      const bool late = Clock::now() >= deadline;
      const std::vector<pid_t> left = ChildrenOfThisProcess();
      // One that even a kill does not end waits for a device, and would do so for ever.
      if (left.empty() || Clock::now() >= deadline + kStopTime) return;
      for (const pid_t pid : left) {
        if (late) {
          kill(pid, SIGKILL);
        } else if (told.insert(pid).second) {
          kill(pid, SIGTERM);
        }
      }
      usleep(std::chrono::microseconds(kStopPause).count());
    }
  }

  const nas::ServerSettings settings_;
  const Proxies proxies_;
  HttpService* service_ = nullptr;
  bool stopping_ = false;
  bool ended_ = false;
  bool accepting_ = false;  // or pausing before it does
  bool awaiting_children_ = false;
  bool errands_wait_ = false;
  std::function<void()> on_hangup_;
  tcp::endpoint endpoint_;
  std::string address_;
  std::set<Connection*> connections_;  // each keeps itself alive by what it waits for
  asio::io_context loop_;
  Turns turns_{&loop_};
  tcp::acceptor acceptor_;
  asio::steady_timer accept_pause_;
  asio::steady_timer errand_timer_;
  asio::steady_timer stop_timer_;
  asio::signal_set stop_signals_;
  asio::signal_set child_signals_;
  asio::signal_set hangup_signals_;
  std::unordered_map<pid_t, std::shared_ptr<ChildPipe>> children_;
};

HttpServer::HttpServer(const nas::ServerSettings& settings)
    : loop_(std::make_unique<Loop>(settings)) {}
HttpServer::~HttpServer() = default;

const std::string& HttpServer::address() const { return loop_->address(); }
int HttpServer::port() const { return loop_->endpoint().port(); }
bool HttpServer::on_loopback() const { return loop_->endpoint().address().is_loopback(); }
ServerCounts HttpServer::counts() const { return loop_->counts(); }
void HttpServer::OnHangup(std::function<void()> action) { loop_->OnHangup(std::move(action)); }
void HttpServer::Run(HttpService* service) { loop_->Run(service); }

}  // namespace arbory
