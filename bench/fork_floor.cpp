// The least a server that forks for each request can do: one thread, one loop, and for every
// request a child that writes a fixed reply and ends. What `arbory serve` takes beyond it is its
// own.
//
//   fork_floor PORT REPLY_BYTES
//
// It knows just enough of HTTP for a load generator: requests end with an empty line and
// Content-Length bytes, and connections stay open.

#include <arpa/inet.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <signal.h>
#include <strings.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <string>
#include <string_view>

namespace {

constexpr int kEvents = 64;
constexpr int kBacklog = 512;  // more than any load generator opens at once
constexpr size_t kReadBytes = 16 << 10;

// The bytes of the first whole request in `text`; 0 when it is not whole yet.
size_t WholeRequest(const std::string& text) {
  constexpr char kLength[] = "\r\ncontent-length:";
  constexpr std::string_view kEnd = "\r\n\r\n";
  const size_t end = text.find(kEnd);
  if (end == std::string::npos) return 0;
  const char* field = strcasestr(text.c_str(), kLength);
  const size_t body = field == nullptr || field > text.c_str() + end
                          ? 0
                          : std::strtoul(field + sizeof kLength - 1, nullptr, 10);
  const size_t whole = end + kEnd.size() + body;
  return text.size() >= whole ? whole : 0;
}

int Listen(int port) {
  const int fd = socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK, 0);
  const int on = 1;
  setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(static_cast<uint16_t>(port));
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  if (bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      listen(fd, kBacklog) != 0) {
    perror("listen");
    exit(1);
  }
  return fd;
}

void Watch(int loop, int fd) {
  epoll_event event = {};
  event.events = EPOLLIN;
  event.data.fd = fd;
  epoll_ctl(loop, EPOLL_CTL_ADD, fd, &event);
}

void Answer(int fd, const std::string& reply) {
  if (fork() != 0) return;
  const ssize_t written = write(fd, reply.data(), reply.size());
  _exit(written == static_cast<ssize_t>(reply.size()) ? 0 : 1);
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 3) {
    fprintf(stderr, "usage: fork_floor PORT REPLY_BYTES\n");
    return 2;
  }
  signal(SIGCHLD, SIG_IGN);  // children are reaped by the system
  const std::string body(std::strtoul(argv[2], nullptr, 10), 'x');
  const std::string reply =
      "HTTP/1.1 200 OK\r\nContent-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
  const int listener = Listen(std::atoi(argv[1]));
  const int loop = epoll_create1(0);
  Watch(loop, listener);
  std::map<int, std::string> clients;
  for (;;) {
    epoll_event events[kEvents];
    const int count = epoll_wait(loop, events, kEvents, -1);
    for (int at = 0; at < count; ++at) {
      const int fd = events[at].data.fd;
      if (fd == listener) {
        const int client = accept4(listener, nullptr, nullptr, SOCK_NONBLOCK);
        const int on = 1;
        setsockopt(client, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
        if (client >= 0) Watch(loop, client);
        continue;
      }
      char bytes[kReadBytes];
      const ssize_t got = read(fd, bytes, sizeof bytes);
      if (got <= 0) {
        clients.erase(fd);
        close(fd);
        continue;
      }
      std::string& text = clients[fd];
      text.append(bytes, static_cast<size_t>(got));
      while (const size_t whole = WholeRequest(text)) {
        Answer(fd, reply);
        text.erase(0, whole);
      }
    }
  }
}
