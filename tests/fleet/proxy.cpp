#include "tests/fleet/proxy.h"

#include <fcntl.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

namespace fleet_test {
namespace {

constexpr char kProxy[] = "/usr/sbin/haproxy";

}  // namespace

void ProxiedTest::TearDown() {
  if (proxy_ > 0) {
    kill(proxy_, SIGTERM);
    waitpid(proxy_, nullptr, 0);
  }
  FrontTest::TearDown();
}

bool ProxiedTest::HaveProxy() { return access(kProxy, X_OK) == 0; }

std::string ProxiedTest::Settings(int deadline_ms) const {
  return "deadline_ms = " + std::to_string(deadline_ms) + "\nproxy = \"" + dir_ +
         "/proxy.sock\"\ntls_folder = \"" + dir_ + "/tls\"\n";
}

std::string ProxiedTest::ConfigCommand(const std::string& reload) const {
  return ARBORY_BIN_DIR "/arbory fleet config " + dir_ + "/fleet.toml --write " + dir_ +
         "/haproxy.cfg" + (reload.empty() ? "" : " --reload '" + reload + "'");
}

void ProxiedTest::StartProxy() {
  ASSERT_EQ(std::system(ConfigCommand().c_str()), 0);
  proxy_ = StartHaproxy(dir_ + "/haproxy.cfg");
  ASSERT_TRUE(
      nas_test::Eventually([&] { return access((dir_ + "/proxy.sock").c_str(), F_OK) == 0; }));
}

void ProxiedTest::ReloadProxy() {
  ASSERT_EQ(std::system(ConfigCommand("kill -USR2 " + std::to_string(proxy_)).c_str()), 0);
}

pid_t ProxiedTest::StartHaproxy(const std::string& config, const std::vector<int>& taken_over) {
  const pid_t pid = fork();
  if (pid != 0) return pid;
  for (const int fd : taken_over) fcntl(fd, F_SETFD, 0);
  prctl(PR_SET_PDEATHSIG, SIGTERM);
  const int log = open((dir_ + "/haproxy.log").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
  dup2(log, STDOUT_FILENO);
  dup2(log, STDERR_FILENO);
  execl(kProxy, kProxy, "-W", "-db", "-f", config.c_str(), nullptr);
  _exit(98);
}

ProxiedTest::Listener ProxiedTest::Listen() {
  Listener listener{nas::UniqueFd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)), {}};
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof address;
  const int fd = listener.socket_fd.get();
  EXPECT_EQ(bind(fd, reinterpret_cast<sockaddr*>(&address), length), 0);
  EXPECT_EQ(listen(fd, SOMAXCONN), 0);
  EXPECT_EQ(getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length), 0);
  listener.port = std::to_string(ntohs(address.sin_port));
  return listener;
}

}  // namespace fleet_test
