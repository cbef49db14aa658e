// What the index daemon does when it, the queue of events or a table breaks, and what it believes
// until all is well again.

#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/wait.h>

#include <ctime>
#include <filesystem>
#include <fstream>

#include "nas/index/mapped_files.h"
#include "nas/index/table_folders.h"
#include "nas/index/watcher_process.h"
#include "tests/index/daemon.h"

namespace index_test {
namespace {

namespace fs = std::filesystem;
using nas_test::Eventually;

class Life : public DaemonTest {
 protected:
  pid_t Watcher() { return Report()["file_systems"][0]["pid"].asInt(); }
  std::string TablePath() {
    for (const auto& file : fs::recursive_directory_iterator(state_ + "/index")) {
      if (file.path().filename() == "names") return file.path();
    }
    return "(none)";
  }
  ino_t InodeOfTable() {
    struct stat status;
    return stat(TablePath().c_str(), &status) == 0 ? status.st_ino : 0;
  }
  void Change(int round) {
    const std::string folder = tree_ + "/round" + std::to_string(round);
    fs::create_directories(folder + "/x/y");
    nas_test::WriteFile(folder + "/x/y/file", "text");
    nas_test::WriteFile(tree_ + "/a/one", std::string(static_cast<size_t>(round), 'x'));
    if (round > 0) fs::remove_all(tree_ + "/round" + std::to_string(round - 1));
  }
  void ExpectEqual() {
    // Names first, while attributes may still be read.
    std::vector<std::string> first;
    EXPECT_TRUE(Eventually([&] {
      first = Differences(tree_);
      return first.size() != 1 || !first.front().starts_with("state: ");
    }));
    EXPECT_EQ(first, std::vector<std::string>());
    ASSERT_TRUE(Current());
    EXPECT_EQ(Differences(tree_), std::vector<std::string>());
    EXPECT_TRUE(See(tree_)["attributes"].asBool());
  }
  // A daemon that knows a tree on a disk of its own. False where there can be none.
  bool StartOnADisk() {
    if (!CanWatchFileSystems()) return false;
    MountTree("ext4");
    if (HasFailure()) return false;
    MakeTree(tree_);
    StartDaemon();
    ExpectEqual();
    return true;
  }
};

TEST_F(Life, SurvivesEveryEnd) {
  if (!StartOnADisk()) GTEST_SKIP() << "needs root that may watch file systems, and a loop device";
  int round = 0;
  const struct {
    const char* why;
    std::function<void()> end;
  } kEnds[] = {
      {"a clean stop and a change that nobody saw",
       [&] {
         Change(round++);
         EXPECT_TRUE(StopDaemon());
         Change(round++);
         StartDaemon();
       }},
      {"the daemon killed",
       [&] {
         const pid_t watcher = Watcher();
         Change(round++);
         EXPECT_FALSE(See(tree_)["changes"].empty());
         const ino_t before = InodeOfTable();
         StopDaemon(SIGKILL);
         EXPECT_TRUE(Eventually([&] { return kill(watcher, 0) != 0; })) << "a watcher is left";
         EXPECT_EQ(InodeOfTable(), before) << "written while the next daemon may have its own";
         Change(round++);
         StartDaemon();
       }},
      {"a watcher killed",
       [&] {
         const pid_t watcher = Watcher();
         kill(watcher, SIGKILL);
         Change(round++);
         EXPECT_TRUE(Eventually([&] { return Watcher() != watcher; }));
       }},
      {"a table that is torn",
       [&] {
         EXPECT_TRUE(StopDaemon());
         for (const auto& file : fs::recursive_directory_iterator(state_ + "/index")) {
           if (file.path().filename() == "names") fs::resize_file(file.path(), 100);
         }
         StartDaemon();
       }},
  };
  for (const auto& [why, end] : kEnds) {
    SCOPED_TRACE(why);
    end();
    ExpectEqual();
  }
}

// Whose table it would be, and what has happened since that was made, only one of them knows.
TEST_F(Life, BeginsOnceTheWatcherBeforeItIsGone) {
  if (!StartOnADisk()) GTEST_SKIP() << "needs root that may watch file systems, and a loop device";
  const pid_t watcher = Watcher();
  Change(0);
  kill(watcher, SIGSTOP);
  StopDaemon(SIGKILL);
  const ino_t before = InodeOfTable();
  StartDaemon();
  ASSERT_TRUE(Eventually([&] { return StateIs("starting"); }));
  EXPECT_TRUE(Eventually([&] { return Watcher() > 0; }));
  // Long enough for one that did not wait.
  for (int look = 0; look < 50; ++look) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
    ASSERT_TRUE(StateIs("starting"));
  }
  EXPECT_EQ(InodeOfTable(), before);
  kill(watcher, SIGCONT);
  ExpectEqual();
}

// Names are answered meanwhile; files' attributes are looked up.
TEST_F(Life, TriesAgainToMakeATable) {
  if (!StartOnADisk()) GTEST_SKIP() << "needs root that may watch file systems, and a loop device";
  EXPECT_TRUE(StopDaemon());
  const std::string unfinished = TablePath() + ".new";
  fs::create_directory(unfinished);
  StartDaemon();
  const auto idle = [&] {
    const std::string watcher = std::to_string(Watcher());
    return StateIs("current") &&
           nas_test::ReadFile("/proc/" + watcher + "/task/" + watcher + "/children").empty();
  };
  int looks = 0;
  ASSERT_TRUE(Eventually([&] { return (looks = idle() ? looks + 1 : 0) > 3; }));
  EXPECT_FALSE(Report()["current"].asBool());
  Change(0);
  EXPECT_EQ(Differences(tree_), std::vector<std::string>());
  fs::remove(unfinished);
  ExpectEqual();
}

TEST_F(Life, FindsItsWayAfterLostEvents) {
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("tmpfs");
  MakeTree(tree_);
  nas::IndexSettings settings;
  settings.max_changes = 50;
  ConfigureIndex(settings);
  StartDaemon();
  ExpectEqual();
  EXPECT_EQ(Report()["file_systems"][0]["swept_at"].asInt64(), 0);
  for (int at = 0; at < 200; ++at) fs::create_directory(tree_ + "/c/" + std::to_string(at) + "d");
  for (int at = 0; at < 200; ++at) {
    nas_test::WriteFile(tree_ + "/c/" + std::to_string(at) + "d/file", "text");
  }
  const std::string state = See(tree_)["state"].asString();
  EXPECT_TRUE(state == "behind" || state == nas::kIndexCurrent) << state;
  EXPECT_TRUE(Eventually([] { return Report()["file_systems"][0]["swept_at"].asInt64() > 0; }));
  ExpectEqual();
}

// The kernel keeps so many events of single folders for a watcher that does not take them, and then
// only says that there were more.
TEST_F(Life, FindsItsWayAfterTheKernelsQueueWasFull) {
  int limit = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> limit;
  constexpr int kMany = 100'000;
  if (limit <= 0 || limit > kMany) GTEST_SKIP() << "the queue holds too many events: " << limit;
  MakeFolder("own", 0777);
  EXPECT_TRUE(nas_test::InOrdinaryChild([&](const std::string&) {
    prctl(PR_SET_DUMPABLE, 1);  // as a process has it that was never root's
    state_ = dir_ + "/own/state";
    tree_ = dir_ + "/own/tree";
    MakeTree(tree_);
    ConfigureIndex();
    StartDaemon();
    ASSERT_TRUE(Current());
    const pid_t watcher = Watcher();
    kill(watcher, SIGSTOP);
    for (int at = 0; at < limit; ++at) {
      const std::string path = tree_ + "/a/" + std::to_string(at % 8);
      nas_test::WriteFile(path, "");
      fs::remove(path);
    }
    nas_test::WriteFile(tree_ + "/c/after the last event", "text");
    kill(watcher, SIGCONT);
    // A look at it comes behind what was queued.
    EXPECT_TRUE(Eventually([&] {
      return See(tree_)["state"].asString() == nas::kIndexCurrent && Differences(tree_).empty();
    }));
    EXPECT_TRUE(StopDaemon());
  }));
}

// A file that a process writes to by its memory alone changes without an event.
TEST_F(Life, DoesNotBelieveMappedFiles) {
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("tmpfs");
  MakeTree(tree_);
  StartDaemon();  // which would inherit what is mapped now
  const std::string path = tree_ + "/a/one";
  const nas::UniqueFd file(open(path.c_str(), O_RDWR | O_CLOEXEC));
  void* mapping = mmap(nullptr, 1, PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
  ASSERT_NE(mapping, MAP_FAILED);
  ASSERT_TRUE(Current());
  // A machine that does much else may not answer in time. Where some process hides what it has
  // mapped, no file is believed.
  const auto doubted = [&](bool asks_times) {
    const Json::Value seen = See(tree_, asks_times);
    return !seen["mappings"].asBool() || Tells(seen["inodes"], path);
  };
  EXPECT_TRUE(Eventually([&] { return doubted(true); }));
  EXPECT_FALSE(doubted(false)) << "looked for though nobody asks";
  munmap(mapping, 1);
}

TEST_F(Life, KnowsWhatAProcessMayHaveMapped) {
  const std::string path = dir_ + "/file";
  nas_test::WriteFile(path, "text");
  const auto told = [&] {
    nas::Changes changes;
    EXPECT_TRUE(nas::AddInodesMappedBy(std::to_string(getpid()), changes));
    struct stat status = {};
    stat(path.c_str(), &status);
    return changes.inodes().contains(status.st_ino);
  };
  nas::UniqueFd file(open(path.c_str(), O_RDWR | O_CLOEXEC));
  void* mapping = mmap(nullptr, 1, PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
  ASSERT_NE(mapping, MAP_FAILED);
  file.Reset();
  EXPECT_TRUE(told()) << "mapped";
  ASSERT_EQ(mprotect(mapping, 1, PROT_READ), 0);
  EXPECT_TRUE(told()) << "may have been written to";
  munmap(mapping, 1);
  EXPECT_FALSE(told()) << "closed, which is an event";
  file.Reset(open(path.c_str(), O_RDWR | O_CLOEXEC));
  EXPECT_TRUE(told()) << "open: may have been mapped";
  file.Reset(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_FALSE(told()) << "open to be read";
}

// Whoever has a file mapped may be outside.
TEST(Mapped, IsNotToldFromWithinAContainer) {
  const pid_t outside = fork();
  if (outside == 0) {
    constexpr int kNoRoot = 2;
    if (unshare(CLONE_NEWNS | CLONE_NEWPID) != 0 ||
        mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
      _exit(kNoRoot);
    }
    const pid_t inside = fork();
    if (inside == 0) {
      if (mount("proc", "/proc", "proc", 0, nullptr) != 0) _exit(kNoRoot);
      nas::Changes changes;
      _exit(nas::AddMappedInodes(changes) ? 1 : 0);
    }
    int status = 0;
    waitpid(inside, &status, 0);
    _exit(WIFEXITED(status) ? WEXITSTATUS(status) : 1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(outside, &status, 0), outside);
  if (WIFEXITED(status) && WEXITSTATUS(status) == 2) GTEST_SKIP() << "needs root";
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
}

// A copy has its original's id, and both may be there at once.
TEST_F(Life, TellsCopiesOfAFileSystemApart) {
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("ext4");
  if (HasFailure()) GTEST_SKIP() << "needs a loop device";
  const std::string original = tree_;
  MakeTree(original);
  sync();
  fs::copy_file(dir_ + "/image", dir_ + "/copied");
  tree_ = MakeFolder("copy");
  MountImage(dir_ + "/copied");
  nas::IndexSettings settings;
  settings.folders = {original, tree_};
  ConfigureIndex(settings);
  StartDaemon();
  ASSERT_TRUE(Current());
  const Json::Value found = Report()["file_systems"];
  ASSERT_EQ(found.size(), 2U);
  EXPECT_NE(found[0]["id"], found[1]["id"]) << "they write one table";
  nas_test::WriteFile(tree_ + "/c/in the copy", "");
  EXPECT_EQ(Texts(See(tree_)["changes"]), std::vector<std::string>{"c/in the copy"});
  EXPECT_EQ(Texts(See(original)["changes"]), std::vector<std::string>());
}

TEST_F(Life, ForgetsFileSystemsThatStayAway) {
  const std::string index = MakeFolder("state", 0755) + "/index";
  const std::time_t now = std::time(nullptr);
  constexpr std::time_t kDay = std::time_t{24} * 60 * 60;
  const struct {
    const char* id;
    std::time_t days_away;
    std::vector<const char*> files;
    bool stays;
  } kFolders[] = {
      {"taken-out", 29, {"names"}, true}, {"thrown-away", 31, {"names", "names.new"}, false},
      {"device-8:1", 0, {}, false},       {"foreign", 31, {"names", "something else"}, true},
      {"there", 31, {"names"}, true},
  };
  for (const auto& [id, days_away, files, stays] : kFolders) {
    const std::string folder = index + "/" + id;
    fs::create_directories(folder);
    for (const char* file : files) nas_test::WriteFile(folder + "/" + file, "");
    const timespec then = {now - days_away * kDay, 0};
    const timespec times[] = {then, then};
    utimensat(AT_FDCWD, folder.c_str(), times, 0);
  }
  nas::Plan plan;
  plan.file_systems.emplace_back().id = "there";
  nas::SweepTableFolders(plan, now);
  for (const auto& [id, days_away, files, stays] : kFolders) {
    EXPECT_EQ(fs::exists(index + "/" + id), stays) << id;
  }
  EXPECT_TRUE(fs::exists(index + "/there/names"));
  // Noted once a day alone.
  nas::SweepTableFolders(plan, now + kDay / 2);
  struct stat status = {};
  stat((index + "/there").c_str(), &status);
  EXPECT_EQ(status.st_mtime, now);
}

// One that dies before it is of use is started ever more seldom, whoever kills others.
TEST_F(Life, PausesForWhatDiesAtOnce) {
  using std::chrono::seconds;
  const struct {
    seconds before, answered, pause;
  } kEnds[] = {
      {seconds(1), seconds(0), seconds(2)},   {seconds(40), seconds(0), seconds(60)},
      {seconds(60), seconds(9), seconds(60)}, {seconds(60), seconds(10), seconds(1)},
      {seconds(1), seconds(10), seconds(1)},
  };
  for (const auto& [before, answered, pause] : kEnds) {
    EXPECT_EQ(nas::RestartPause(before, answered), pause) << before.count();
  }
}

// Nobody knows of a file system before a plan has come.
TEST_F(Life, PlansAgainWhenAPlanFails) {
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("tmpfs");
  StartDaemon([] {
    // Its only child.
    const std::string own = std::to_string(getpid());
    std::ifstream children("/proc/" + own + "/task/" + own + "/children");
    pid_t planner = -1;
    if (children >> planner) kill(planner, SIGKILL);
  });
  EXPECT_TRUE(Current());
  EXPECT_EQ(Report()["file_systems"].size(), 1U);
}

}  // namespace
}  // namespace index_test
