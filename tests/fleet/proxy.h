#pragma once
// HAProxy, as `arbory fleet config` sets it up.

#include <sys/types.h>

#include <string>
#include <vector>

#include "nas/base/unique_fd.h"
#include "tests/fleet/front.h"

namespace fleet_test {

class ProxiedTest : public FrontTest {
 protected:
  void TearDown() override;

  static bool HaveProxy();
  // For a front's file: where the proxy listens, and a deadline.
  std::string Settings(int deadline_ms = 3000) const;
  std::string ConfigCommand(const std::string& reload = "") const;
  // With what the front's file says.
  void StartProxy();
  // Has it read what the front's file says now.
  void ReloadProxy();
  // Any; `taken_over` are the descriptors that it gets as they are.
  pid_t StartHaproxy(const std::string& config, const std::vector<int>& taken_over = {});

  // Listens at a port of 127.0.0.1 that nobody else can have meanwhile; a proxy takes it over.
  struct Listener {
    nas::UniqueFd socket_fd;
    std::string port;
  };
  static Listener Listen();

  pid_t proxy_ = -1;
};

}  // namespace fleet_test
