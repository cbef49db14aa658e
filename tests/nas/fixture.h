#pragma once
// A private state directory and private volumes for each test, and a look afterwards at what the
// test left behind: open descriptors and child processes.

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "nas/system/config.h"

namespace nas_test {

// An account that every system has, that is not root, and that owns nothing.
inline constexpr char kOtherUser[] = "nobody";

// The name of the user the tests run as.
std::string Me();
bool AmRoot();

// Runs `body` in a forked child. True when it ended by itself without a failed expectation.
bool InChild(const std::function<void()>& body);
// The same as an ordinary user for good: as kOtherUser when the tests run as root.
bool InOrdinaryChild(const std::function<void(const std::string& user)>& body);

void WriteFile(const std::string& path, const std::string& bytes);
// The content; "(none)" when there is no such file.
std::string ReadFile(const std::string& path);
mode_t ModeOf(const std::string& path);
std::vector<std::string> OpenDescriptors();

class PlatformTest : public testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // Takes effect in this process. Volumes are VOLUMES/volume*.
  void Configure(std::vector<nas::ShareSetting> shares = {});
  std::string MakeFolder(const std::string& below, mode_t mode = 0755);

  std::string dir_;    // everything of this test
  std::string state_;  // dir_/state

 private:
  std::vector<std::string> descriptors_;
  mode_t umask_ = 0;
};

}  // namespace nas_test

// Where only root can make the case. The reason is printed and counted by the runner.
#define SKIP_UNLESS_ROOT() \
  if (!nas_test::AmRoot()) GTEST_SKIP() << "needs root: only root can become another user"
