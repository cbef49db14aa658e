// Bytes of a client through a connection: in which pieces they come must not change which requests
// are seen and what is answered, and nothing may follow a reply that its length does not announce.

#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/read.hpp>
#include <boost/asio/write.hpp>
#include <set>
#include <vector>

#include "arbory/server/transport/addresses.h"
#include "arbory/server/transport/connection.h"
#include "arbory/server/transport/http_text.h"
#include "tests/fuzz/fuzz.h"

namespace {

namespace asio = boost::asio;
using asio::ip::tcp;

constexpr int kBodyBytes = 4096;
constexpr size_t kMostBytes = size_t{40} << 10;

class EndlessRoom : public arbory::BodyRoom {
 public:
  bool Take(std::uint64_t /*bytes*/) override { return true; }
};

// Answers every request with what it was taken for.
class Echo : public arbory::HttpService {
 public:
  std::shared_ptr<arbory::BodyRoom> RoomFor(const arbory::HttpRequest& /*request*/) override {
    return std::make_shared<EndlessRoom>();
  }
  arbory::Answer Handle(arbory::HttpRequest* request) override {
    Check(*request);
    methods.push_back(request->method);
    std::string seen = request->method + " " + request->target + "\n";
    for (const auto& [name, value] : request->fields) seen += name + ": " + value + "\n";
    return arbory::JsonReply(arbory::kOk, seen + "\n" + request->body);
  }
  void Finished(const arbory::HttpRequest& /*request*/, int /*status*/,
                std::uint64_t /*bytes*/) override {
    ++finished;
  }

  std::vector<std::string> methods;
  size_t finished = 0;

 private:
  static void Check(const arbory::HttpRequest& request) {
    DEMAND(!request.method.empty() && !request.target.empty());
    DEMAND(request.body.size() <= kBodyBytes);
    for (const unsigned char byte : request.method + request.target) DEMAND(byte > ' ');
    for (const auto& [name, value] : request.fields) {
      DEMAND(name == arbory::LowerCase(name));
      DEMAND((name + value).find_first_of(std::string_view("\r\n\0", 3)) == std::string::npos);
    }
    // Two readers of the same bytes must agree where a body ends.
    const std::string* length = request.Field("content-length");
    const bool coded = request.CountOf("transfer-encoding") > 0;
    DEMAND(length == nullptr || !coded);
    if (length != nullptr) DEMAND(std::stoull(*length) == request.body.size());
    if (length == nullptr && !coded) DEMAND(request.body.empty());
  }
};

class Host : public arbory::ConnectionHost {
 public:
  explicit Host(asio::io_context* loop) : loop_(*loop) { settings_.body_bytes = kBodyBytes; }
  asio::io_context& loop() override { return loop_; }
  const nas::ServerSettings& settings() const override { return settings_; }
  const arbory::Proxies& proxies() const override { return proxies_; }
  arbory::HttpService& service() override { return echo; }
  bool stopping() const override { return false; }
  arbory::Turns& turns() override { return turns_; }
  std::shared_ptr<arbory::ChildPipe> Adopt(arbory::ChildAnswer* /*answer*/) override {
    return nullptr;
  }
  void Closed(arbory::Connection* /*connection*/) override { closed = true; }

  Echo echo;
  bool closed = false;

 private:
  asio::io_context& loop_;
  arbory::Turns turns_{&loop_};
  nas::ServerSettings settings_;
  arbory::Proxies proxies_{{}};
};

struct Exchange {
  std::vector<std::string> methods;
  std::string replies;  // without their dates
};

std::string WithoutDates(std::string text) {
  constexpr std::string_view kDate = "\r\nDate: ";
  for (size_t at = 0; (at = text.find(kDate, at)) != std::string::npos;) {
    text.erase(at, text.find("\r\n", at + 2) - at);
  }
  return text;
}

// Sends the bytes in two pieces and then nothing more.
Exchange Talk(std::string_view bytes, size_t cut) {
  constexpr std::chrono::seconds kPatience{5};
  asio::io_context loop;
  tcp::acceptor acceptor(loop, {asio::ip::address_v4::loopback(), 0});
  tcp::socket client(loop);
  client.connect(acceptor.local_endpoint());
  Host host(&loop);
  std::make_shared<arbory::Connection>(&host, acceptor.accept())->Start();
  asio::write(client, asio::buffer(bytes.substr(0, cut)));
  boost::system::error_code end;  // of a client that has been turned away after the first piece
  if (cut < bytes.size()) {
    loop.poll();
    asio::write(client, asio::buffer(bytes.substr(cut)), end);
  }
  client.shutdown(tcp::socket::shutdown_send, end);
  loop.restart();
  loop.run_for(kPatience);
  DEMAND(host.closed && host.echo.finished >= host.echo.methods.size());
  std::string replies;
  asio::read(client, asio::dynamic_buffer(replies), end);
  return {host.echo.methods, WithoutDates(std::move(replies))};
}

// Takes one reply apart; false where it is only the leave to go on.
bool TakeReply(std::string_view* rest, bool body_expected) {
  DEMAND(rest->starts_with("HTTP/1.1 "));
  const size_t end = rest->find("\r\n\r\n");
  DEMAND(end != std::string_view::npos);
  const std::string_view head = rest->substr(0, end + 2);
  rest->remove_prefix(end + 4);
  if (head.starts_with("HTTP/1.1 100 ")) return false;
  constexpr std::string_view kLength = "\r\nContent-Length: ";
  const size_t at = head.find(kLength);
  DEMAND(at != std::string_view::npos);
  const size_t length = std::stoul(std::string(head.substr(at + kLength.size())));
  if (!body_expected && rest->size() < length) return true;
  if (body_expected) {
    DEMAND(rest->size() >= length);
    rest->remove_prefix(length);
  }
  return true;
}

void CheckReplies(const Exchange& exchange) {
  std::string_view rest = exchange.replies;
  for (const std::string& method : exchange.methods) {
    while (!TakeReply(&rest, method != "HEAD")) {
    }
  }
  // At most one refusal is left, of what was no request; without a body where it asked for none.
  if (rest.starts_with("HTTP/1.1 100 ")) TakeReply(&rest, false);
  if (rest.empty()) return;
  DEMAND(rest.starts_with("HTTP/1.1 4"));
  DEMAND(rest.find("\r\nConnection: close\r\n") != std::string_view::npos);
  const bool has_body = !rest.ends_with("\r\n\r\n");
  TakeReply(&rest, has_body);
  DEMAND(rest.empty());
}

}  // namespace

// Where the bytes are cut, as a share of their length, and the bytes.
int fuzz::Target(std::string_view input) {
  if (input.size() < 2 || input.size() > kMostBytes) return fuzz::kUseless;
  const std::string_view bytes = input.substr(1);
  const Exchange whole = Talk(bytes, bytes.size());
  CheckReplies(whole);
  constexpr size_t kShares = 256;
  for (const size_t cut :
       {bytes.size() * static_cast<unsigned char>(input[0]) / kShares, bytes.size() - 1}) {
    const Exchange pieces = Talk(bytes, cut);
    DEMAND(pieces.methods == whole.methods && pieces.replies == whole.replies);
  }
  return fuzz::kUsed;
}
