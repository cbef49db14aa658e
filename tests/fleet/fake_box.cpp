#include "tests/fleet/fake_box.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

namespace fleet_test {

FakeBox::FakeBox(Answer answer)
    : answer_(std::move(answer)), listener_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof address;
  auto* const plain = reinterpret_cast<sockaddr*>(&address);
  EXPECT_EQ(bind(listener_.get(), plain, length), 0);
  EXPECT_EQ(listen(listener_.get(), SOMAXCONN), 0);
  EXPECT_EQ(getsockname(listener_.get(), plain, &length), 0);
  port_ = ntohs(address.sin_port);
  thread_ = std::thread([this] { Serve(); });
}

FakeBox::FakeBox() : FakeBox([this](const std::string&, const auto& send) { send(said_); }) {}

void FakeBox::Say(std::string reply) {
  const auto paused = Paused();
  said_ = std::move(reply);
}

FakeBox::~FakeBox() {
  ended_ = true;
  thread_.join();
}

void FakeBox::Serve() {
  constexpr int kTickMs = 20;
  while (!ended_) {
    pollfd waiting = {listener_.get(), POLLIN, 0};
    if (poll(&waiting, 1, kTickMs) != 1) continue;
    const nas::UniqueFd peer(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    std::string request(size_t{64} << 10, '\0');
    const ssize_t count = recv(peer.get(), request.data(), request.size(), 0);
    request.resize(count > 0 ? static_cast<size_t>(count) : 0);
    const auto answering = Paused();
    answer_(request, [&](const std::string& bytes) {
      size_t done = 0;
      while (done < bytes.size() && !ended_) {
        const ssize_t sent =
            send(peer.get(), bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
        if (sent <= 0) return false;
        done += static_cast<size_t>(sent);
      }
      return !ended_;
    });
  }
}

Box FakeBox::AsBox(const std::string& name) const {
  Box box{name, {}, ""};
  box.server.port = port_;
  return box;
}

std::string FakeBox::Reply(const std::string& body, const std::string& fields,
                           const std::string& status) {
  return "HTTP/1.1 " + status + "\r\nContent-Length: " + std::to_string(body.size()) +
         "\r\nConnection: close\r\n" + fields + "\r\n" + body;
}

}  // namespace fleet_test
