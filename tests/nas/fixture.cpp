#include "tests/nas/fixture.h"

#include <grp.h>
#include <pwd.h>

#include <fstream>
#include <iterator>

#include "nas/base/sqlite.h"

namespace nas_test {

std::string Me() { return getpwuid(geteuid())->pw_name; }
bool AmRoot() { return geteuid() == 0; }

bool InChild(const std::function<void()>& body) {
  const pid_t child = fork();
  if (child == 0) {
    // The child starts with the failures that its parent has seen.
    const auto* result = testing::UnitTest::GetInstance()->current_test_info()->result();
    const int before = result->total_part_count();
    body();
    fflush(nullptr);
    _exit(result->total_part_count() == before ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

bool InChildren(int count, const std::function<bool(int number)>& body) {
  for (int number = 0; number < count; ++number) {
    if (fork() == 0) _exit(body(number) ? 0 : 1);
  }
  bool good = true;
  for (int status = -1; count > 0 && wait(&status) > 0; --count) good &= status == 0;
  return good && count == 0;
}

bool InOrdinaryChild(const std::function<void(const std::string& user)>& body) {
  return InChild([&] {
    if (AmRoot()) {
      const passwd* other = getpwnam(kOtherUser);
      ASSERT_EQ(setgroups(0, nullptr), 0);
      ASSERT_EQ(setresgid(other->pw_gid, other->pw_gid, other->pw_gid), 0);
      ASSERT_EQ(setresuid(other->pw_uid, other->pw_uid, other->pw_uid), 0);
    }
    body(Me());
  });
}

bool Eventually(const std::function<bool()>& holds, std::chrono::seconds bound) {
  constexpr std::chrono::milliseconds kStep{5};
  const auto end = std::chrono::steady_clock::now() + bound;
  while (!holds()) {
    if (std::chrono::steady_clock::now() > end) return false;
    std::this_thread::sleep_for(kStep);
  }
  return true;
}

void WriteFile(const std::string& path, const std::string& bytes) {
  std::ofstream(path, std::ios::binary) << bytes;
}

std::string ReadFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  if (!file || !std::filesystem::is_regular_file(path)) return "(none)";
  return {std::istreambuf_iterator<char>(file), {}};
}

mode_t ModeOf(const std::string& path) {
  struct stat info = {};
  return lstat(path.c_str(), &info) == 0 ? info.st_mode & 07777 : 0;
}

std::vector<std::string> OpenDescriptors() {
  std::vector<std::string> open;
  for (int fd = 0; fd < 256; ++fd) {
    const std::string link = "/proc/self/fd/" + std::to_string(fd);
    char target[512];
    const ssize_t length = readlink(link.c_str(), target, sizeof target);
    if (length > 0) open.push_back(std::to_string(fd) + " " + std::string(target, length));
  }
  return open;
}

void ChangeDatabase(const std::string& path, const std::string& sql) {
  nas::Database(path, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, 0).Execute(sql.c_str());
}

FullDisk::FullDisk(rlim_t bytes) : handler_(std::signal(SIGXFSZ, SIG_IGN)) {
  getrlimit(RLIMIT_FSIZE, &before_);
  rlimit none = before_;
  none.rlim_cur = bytes;
  setrlimit(RLIMIT_FSIZE, &none);
}

FullDisk::~FullDisk() {
  setrlimit(RLIMIT_FSIZE, &before_);
  std::signal(SIGXFSZ, handler_);
}

void PlatformTest::SetUp() {
  std::string name = testing::TempDir() + "arbory-XXXXXX";
  ASSERT_NE(mkdtemp(name.data()), nullptr);
  ASSERT_EQ(chmod(name.c_str(), 0755), 0);
  dir_ = std::filesystem::canonical(name);
  state_ = dir_ + "/state";
  descriptors_ = OpenDescriptors();
  umask_ = umask(022);
  Configure();
}

void PlatformTest::TearDown() {
  umask(umask_);
  EXPECT_EQ(OpenDescriptors(), descriptors_) << "descriptors left open";
  EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1) << "a child process is left";
  // What a call has left to a cleaner may go at the same time.
  EXPECT_TRUE(Eventually([&] {
    std::error_code trouble;
    std::filesystem::remove_all(dir_, trouble);
    return !trouble;
  })) << dir_;
}

void PlatformTest::Configure(std::vector<nas::ShareSetting> shares) {
  nas::Config config;
  config.state_dir = state_;
  config.volumes = {dir_ + "/volume*"};
  config.shares = std::move(shares);
  nas::Configure(config);
}

std::string PlatformTest::MakeFolder(const std::string& below, mode_t mode) {
  const std::string path = dir_ + "/" + below;
  std::filesystem::create_directories(path);
  EXPECT_EQ(chmod(path.c_str(), mode), 0);
  return path;
}

}  // namespace nas_test
