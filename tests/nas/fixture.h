#pragma once
// A private state directory and private volumes for each test, and a look afterwards at what the
// test left behind: open descriptors and child processes. Brings along what tests of files,
// processes and waits all need of the system.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "nas/system/config.h"

namespace nas_test {

// An account that every system has, that is not root, and that owns nothing.
inline constexpr char kOtherUser[] = "nobody";

// Whether nas::LimitMemory does, which sanitizers would not survive.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr bool kMemoryIsBounded = false;
#else
inline constexpr bool kMemoryIsBounded = true;
#endif

// The name of the user the tests run as.
std::string Me();
bool AmRoot();

// Runs `body` in a forked child. True when it ended by itself without a failed expectation.
bool InChild(const std::function<void()>& body);
// Runs `body` in so many children at once, each with its number. True when it was true in all.
bool InChildren(int count, const std::function<bool(int number)>& body);
// InChild as an ordinary user for good: as kOtherUser when the tests run as root.
bool InOrdinaryChild(const std::function<void(const std::string& user)>& body);

// A test's bound on what should take no time, on a loaded machine with sanitizers.
inline constexpr std::chrono::seconds kSoon{20};
// Waits until it holds; false when `bound` has passed.
bool Eventually(const std::function<bool()>& holds, std::chrono::seconds bound = kSoon);

void WriteFile(const std::string& path, const std::string& bytes);
// The content; "(none)" when there is no such file.
std::string ReadFile(const std::string& path);
mode_t ModeOf(const std::string& path);
std::vector<std::string> OpenDescriptors();

// Does to a database what its user may.
void ChangeDatabase(const std::string& path, const std::string& sql);

// No file of this process can grow beyond a few kilobytes while it lives, as on a full disk.
class FullDisk {
 public:
  static constexpr rlim_t kRecordBytes = 64 * 1024;  // enough for a task record, not for results
  explicit FullDisk(rlim_t bytes = kRecordBytes);
  ~FullDisk();
  FullDisk(const FullDisk&) = delete;
  FullDisk& operator=(const FullDisk&) = delete;

 private:
  void (*handler_)(int);
  rlimit before_ = {};
};

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
