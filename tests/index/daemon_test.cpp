// The index daemon as a whole: what its answers are based on after each kind of change, whose
// process gives them, and what it bounds.

#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <grp.h>
#include <pwd.h>
#include <filesystem>
#include <fstream>

#include "nas/index/broker.h"
#include "nas/index/daemon_socket.h"
#include "nas/index/question_child.h"
#include "platform/system.h"
#include "tests/index/daemon.h"

namespace index_test {
namespace {

namespace fs = std::filesystem;
using nas_test::Eventually;

struct Change {
  const char* why;
  std::function<void(const std::string& tree)> make;
  std::vector<std::string> noted;
  std::string inode = {};  // of which attributes are not believed
};

const std::vector<Change> kChanges = {
    {"a new file, and its folder's time",
     [](const std::string& tree) { nas_test::WriteFile(tree + "/a/new", ""); },
     {"a/new"},
     "/a"},
    {"a removed file",
     [](const std::string& tree) { fs::remove(tree + "/a/one"); },
     {"a/one"},
     "/a"},
    {"a renamed file is two names",
     [](const std::string& tree) { fs::rename(tree + "/a/one", tree + "/c/uno"); },
     {"a/one", "c/uno"},
     "/c"},
    {"a renamed folder is two names, and what happens in it is known still",
     [](const std::string& tree) {
       fs::rename(tree + "/a/b", tree + "/c/d");
       nas_test::WriteFile(tree + "/c/d/later", "");
     },
     {"a/b", "a/b/later", "c/d"},
     "/c/d"},
    {"below a new folder nothing is known, so nothing is noted",
     [](const std::string& tree) {
       fs::create_directories(tree + "/n/m");
       nas_test::WriteFile(tree + "/n/m/file", "");
     },
     {"n"},
     ""},
    {"outside of the tree",
     [](const std::string& tree) { nas_test::WriteFile(tree + ".x", ""); },
     {}},
    {"many names of one folder are the folder",
     [](const std::string& tree) {
       for (int at = 0; at < 100; ++at) nas_test::WriteFile(tree + "/c/" + std::to_string(at), "");
     },
     {"c/*"},
     "/c"},
};

// Which only events of a whole file system tell.
const std::vector<Change> kAttributeChanges = {
    {"a mode", [](const std::string& tree) { chmod((tree + "/a/one").c_str(), 0600); }, {"a/one"}},
    {"a size", [](const std::string& tree) { truncate((tree + "/a/one").c_str(), 1); }, {"a/one"}},
    {"a time",
     [](const std::string& tree) { utimensat(AT_FDCWD, (tree + "/a/one").c_str(), nullptr, 0); },
     {"a/one"}},
    {"a link changes what it is a name of",
     [](const std::string& tree) { fs::create_hard_link(tree + "/a/one", tree + "/c/link"); },
     {"c/link"},
     "/a/one"},
    {"a folder's own mode",
     [](const std::string& tree) { chmod((tree + "/a").c_str(), 0700); },
     {},
     "/a"},
};

class Events : public DaemonTest {
 protected:
  void Check(const std::vector<Change>& changes) {
    for (const Change& change : changes) {
      SCOPED_TRACE(change.why);
      for (const auto& entry : fs::directory_iterator(tree_)) fs::remove_all(entry);
      MakeTree(tree_);
      StartDaemon();
      ASSERT_TRUE(Current());
      EXPECT_EQ(Texts(See(tree_)["changes"]), std::vector<std::string>());
      change.make(tree_);
      const Json::Value seen = See(tree_);
      EXPECT_EQ(Texts(seen["changes"]), change.noted);
      if (!change.inode.empty()) {
        EXPECT_TRUE(Tells(seen["inodes"], tree_ + change.inode));
      }
      EXPECT_TRUE(StopDaemon());
    }
  }
};

TEST_F(Events, OfAWholeFileSystem) {
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("tmpfs");
  Check(kChanges);
  Check(kAttributeChanges);
}

// Without root: names alone, so attributes are never believed.
TEST_F(Events, OfSingleFolders) {
  MakeFolder("own", 0777);
  EXPECT_TRUE(nas_test::InOrdinaryChild([&](const std::string&) {
    prctl(PR_SET_DUMPABLE, 1);  // as a process has it that was never root's
    state_ = dir_ + "/own/state";
    tree_ = dir_ + "/own/tree";
    fs::create_directory(tree_);
    ConfigureIndex();
    Check(kChanges);
    StartDaemon();
    ASSERT_TRUE(Current());
    const Json::Value seen = See(tree_, true);
    EXPECT_FALSE(seen["attributes"].asBool());
    EXPECT_EQ(Differences(tree_), std::vector<std::string>());
    EXPECT_TRUE(StopDaemon());
  }));
}

class Identity : public DaemonTest {};

TEST_F(Identity, TheAnswererIsTheAskerForGood) {
  SKIP_UNLESS_ROOT();
  MountTree("tmpfs");
  MakeTree(tree_);
  StartDaemon();
  ASSERT_TRUE(Current());
  const passwd* other = getpwnam(nas_test::kOtherUser);
  const struct {
    const char* why;
    uid_t uid;
    gid_t gid;
    std::vector<gid_t> groups;
  } kAskers[] = {
      {"root itself", 0, 0, {0, 4}},
      {"a user without other groups", other->pw_uid, other->pw_gid, {}},
      {"a user with groups", other->pw_uid, 100, {7, 4242, 100'000}},
      {"a user that no account is of", 54'321, 54'321, {54'321}},
  };
  for (const auto& asker : kAskers) {
    SCOPED_TRACE(asker.why);
    EXPECT_TRUE(nas_test::InChild([&] {
      ASSERT_EQ(setgroups(asker.groups.size(), asker.groups.data()), 0);
      ASSERT_EQ(setresgid(asker.gid, asker.gid, asker.gid), 0);
      ASSERT_EQ(setresuid(asker.uid, asker.uid, asker.uid), 0);
      const Json::Value seen = See(tree_);
      EXPECT_EQ(seen["state"].asString(), nas::kIndexCurrent);
      EXPECT_EQ(seen["uid"].asUInt(), asker.uid);
      EXPECT_EQ(seen["gid"].asUInt(), asker.gid);
      std::vector<gid_t> groups;
      for (const Json::Value& group : seen["groups"]) groups.push_back(group.asUInt());
      EXPECT_EQ(groups, asker.groups);
      EXPECT_EQ(seen["root_again"].asBool(), asker.uid == 0);
      EXPECT_FALSE(seen["traceable"].asBool());
      EXPECT_FALSE(seen["new_rights"].asBool());
      EXPECT_EQ(seen["descriptors"].asInt(), 5) << "beside the streams, connection and location";
    }));
  }
}

TEST_F(Identity, NumbersAreForTheMasterAlone) {
  SKIP_UNLESS_ROOT();
  MountTree("tmpfs");
  StartDaemon();
  ASSERT_TRUE(Current());
  EXPECT_TRUE(Report()["file_systems"][0].isMember("entries"));
  EXPECT_TRUE(nas_test::InOrdinaryChild([&](const std::string&) {
    const Json::Value report = Report();
    EXPECT_TRUE(report["current"].asBool());
    EXPECT_EQ(report["file_systems"][0].getMemberNames(),
              (std::vector<std::string>{"attributes", "state", "type"}));
    EXPECT_EQ(nas::AskDaemon(nas::HelloKind::kRebuild).value_or(""), "not allowed");
    EXPECT_EQ(Differences(tree_), std::vector<std::string>{"state: not allowed"});
  }));
}

// What any user could set up in a place that they may write to.
TEST_F(Identity, OnlyRootAndOneselfAreBelieved) {
  SKIP_UNLESS_ROOT();
  MakeFolder("state", 0777);
  const pid_t liar = fork();
  if (liar == 0) {
    nas_test::InOrdinaryChild([&](const std::string&) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      sockaddr_un address = {};
      address.sun_family = AF_UNIX;
      (state_ + "/index.sock").copy(address.sun_path, sizeof address.sun_path - 1);
      const nas::UniqueFd listener(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
      if (bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0) {
        listen(listener.get(), 1);
      }
      pause();
    });
    _exit(0);
  }
  ASSERT_TRUE(Eventually([&] { return fs::exists(state_ + "/index.sock"); }));
  EXPECT_EQ(nas::ConnectToIndex(state_ + "/index.sock", 1000).error().error_number, EPERM);
  EXPECT_EQ(See(tree_)["state"].asString(), "no index");
  kill(liar, SIGKILL);
  waitpid(liar, nullptr, 0);
}

class Bounds : public DaemonTest {};

TEST_F(Bounds, OnQuestionsOfAUser) {
  SKIP_UNLESS_ROOT();
  MountTree("tmpfs");
  nas::IndexSettings settings;
  settings.questions_per_user = 2;
  ConfigureIndex(settings);
  StartDaemon();
  ASSERT_TRUE(Current());
  nas::IndexAnswer first = Hold(tree_);
  const nas::IndexAnswer second = Hold(tree_);
  EXPECT_EQ(first.state, nas::kIndexCurrent);
  EXPECT_EQ(second.state, nas::kIndexCurrent);
  EXPECT_EQ(Hold(tree_).state, "busy");
  EXPECT_TRUE(nas_test::InOrdinaryChild(
      [&](const std::string&) { EXPECT_EQ(Hold(tree_).state, nas::kIndexCurrent); }));
  first.connection.Reset();
  EXPECT_TRUE(Eventually([&] { return Hold(tree_).state == nas::kIndexCurrent; }))
      << "a place that is free again is not given";
}

// How many descriptors the process waits for in all.
size_t WatchedBy(pid_t pid) {
  size_t count = 0;
  for (const auto& one : fs::directory_iterator("/proc/" + std::to_string(pid) + "/fdinfo")) {
    std::ifstream info(one.path());
    for (std::string line; std::getline(info, line);) count += line.starts_with("tfd:") ? 1 : 0;
  }
  return count;
}

// What is said to a child that answers would wake the broker without end.
TEST_F(Bounds, ABrokerHearsNothingOfAQuestionThatIsHandedOn) {
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("tmpfs");
  StartDaemon();
  ASSERT_TRUE(Current());
  const size_t idle = WatchedBy(daemon_);
  EXPECT_GT(idle, 0U);
  const nas::IndexAnswer held = Hold(tree_);
  EXPECT_EQ(held.state, nas::kIndexCurrent);
  EXPECT_EQ(WatchedBy(daemon_), idle);
}

TEST_F(Bounds, OnThoseWhoSayNothing) {
  SKIP_UNLESS_ROOT();
  MountTree("tmpfs");
  StartDaemon();
  ASSERT_TRUE(Current());
  std::vector<nas::UniqueFd> silent;
  for (int at = 0; at < 200; ++at) {
    auto connection = nas::ConnectToIndex(state_ + "/index.sock", 1000);
    if (connection) silent.push_back(std::move(*connection));
    if (at % 20 != 0) continue;
    EXPECT_EQ(See(tree_)["state"].asString(), nas::kIndexCurrent) << at;
  }
  EXPECT_GE(silent.size(), 100U);
  EXPECT_EQ(write(silent.back().get(), "??", 2), 2);
  EXPECT_EQ(See(tree_)["state"].asString(), nas::kIndexCurrent);
  EXPECT_EQ(See(dir_)["state"].asString(), "not indexed");
}

TEST_F(Bounds, OneDaemonForOneState) {
  StartDaemon();
  EXPECT_TRUE(nas_test::InChild([&] {
    nas::IndexSettings settings;
    settings.socket = state_ + "/other.sock";
    const nas::Status second = nas::RunIndexDaemon({}, [] {});
    EXPECT_EQ(second.error().error_number, EADDRINUSE);
  }));
}

TEST_F(Bounds, AShareIsIndexedWhenItIs) {
  EXPECT_EQ(FILEIDXIsShareIndexed("tree"), 0);
  if (!CanWatchFileSystems()) GTEST_SKIP() << "needs root that may watch file systems";
  MountTree("tmpfs");
  StartDaemon();
  ASSERT_TRUE(Current());
  EXPECT_EQ(FILEIDXIsShareIndexed("tree"), 1);
  EXPECT_EQ(FILEIDXIsShareIndexed("none"), 0);
  EXPECT_TRUE(StopDaemon());
  EXPECT_EQ(FILEIDXIsShareIndexed("tree"), 0);
}

}  // namespace
}  // namespace index_test
