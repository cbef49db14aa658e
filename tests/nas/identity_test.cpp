// Who the process is, what it may then do, and commands that run confined.

#include <grp.h>

#include <set>

#include "nas/system/identity.h"
#include "nas/system/shares.h"
#include "nas/system/user_state.h"
#include "nas/system/volumes.h"
#include "platform/system.h"
#include "platform/webfm.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

class IdentityTest : public PlatformTest {};

void ExpectIds(uid_t real, uid_t effective, uid_t saved, gid_t group) {
  uid_t uid[3];
  gid_t gid[3];
  getresuid(&uid[0], &uid[1], &uid[2]);
  getresgid(&gid[0], &gid[1], &gid[2]);
  EXPECT_EQ(uid[0], real);
  EXPECT_EQ(uid[1], effective);
  EXPECT_EQ(uid[2], saved);
  EXPECT_EQ(gid[0], group);
  EXPECT_EQ(gid[1], group);
}

TEST_F(IdentityTest, RootBecomesAUserAndAnother) {
  SKIP_UNLESS_ROOT();
  WriteFile(dir_ + "/secret", "");
  ASSERT_EQ(chmod((dir_ + "/secret").c_str(), 0600), 0);
  EXPECT_TRUE(InChild([&] {
    const gid_t roots_groups[] = {0, 4};
    ASSERT_EQ(setgroups(2, roots_groups), 0);
    struct {
      const char* user;
      uid_t uid;
      gid_t gid;
    } const rows[] = {{"nobody", 65534, 65534},
                      {"nobody", 65534, 65534},
                      {"games", 5, 60},
                      {"root", 0, 0},
                      {"nobody", 65534, 65534}};
    for (const auto& row : rows) {
      ASSERT_EQ(WfmLibUGIDSet("session", row.user), 0) << row.user;
      ExpectIds(row.uid, row.uid, 0, row.gid);
      gid_t groups[16];
      const int count = getgroups(16, groups);
      for (int at = 0; row.uid != 0 && at < count; ++at) EXPECT_NE(groups[at], 4U) << row.user;
      EXPECT_EQ(GetACLPrivilege((dir_ + "/secret").c_str()), row.uid == 0 ? 6 : 0) << row.user;
      EXPECT_EQ(kill(getppid(), 0), row.uid == 0 ? 0 : -1) << "root's process";
    }
    {
      const nas::ScopedRoot root;
      EXPECT_EQ(geteuid(), 0U);
    }
    ExpectIds(65534, 65534, 0, 65534);
    EXPECT_EQ(WfmLibUGIDSet(nullptr, "no-such-user-here"), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(WfmLibGetErr(), 405);
    ExpectIds(65534, 65534, 0, 65534);
  }));
  EXPECT_EQ(kill(getpid(), 0), 0);
}

TEST_F(IdentityTest, AnOrdinaryUserBecomesOnlyItself) {
  EXPECT_TRUE(InOrdinaryChild([](const std::string& user) {
    const uid_t uid = getuid();
    EXPECT_EQ(WfmLibUGIDSet(nullptr, user.c_str()), 0);
    for (const char* other : {"root", "games"}) {
      EXPECT_EQ(WfmLibUGIDSet(nullptr, other), -1) << other;
      EXPECT_EQ(errno, EPERM);
      EXPECT_EQ(NLIBCErrGet(), 0x0300);
    }
    EXPECT_EQ(WfmLibUGIDSet(nullptr, nullptr), -1);
    {
      const nas::ScopedRoot root;
      EXPECT_EQ(geteuid(), uid) << "root was never there";
    }
    ExpectIds(uid, uid, uid, getgid());
  }));
}

TEST_F(IdentityTest, AccountsAreFoundByName) {
  NUVAUSER* user = nullptr;
  ASSERT_EQ(NUVAUserGet(kOtherUser, &user), 0);
  EXPECT_STREQ(user->szName, kOtherUser);
  NUVAUserFree(user);
  NUVAGROUP* group = nullptr;
  ASSERT_EQ(NUVAGroupGet("daemon", &group), 0);
  EXPECT_EQ(group->nGid, 1U);
  NUVAGroupFree(group);
  EXPECT_LT(NUVAUserGet("no-such-user-here", &user), 0);
  EXPECT_EQ(NLIBCErrGet(), 0x1800);
  EXPECT_LT(NUVAGroupGet("no-such-group-here", &group), 0);
  EXPECT_EQ(NLIBCErrGet(), 0x1D00);
  EXPECT_EQ(WfmLibGetErr(), 405);
  EXPECT_EQ(user, nullptr);
  EXPECT_EQ(group, nullptr);
}

TEST_F(IdentityTest, PrivilegesAndAclsOfFiles) {
  EXPECT_EQ(GetACLPrivilege(""), 0);
  EXPECT_EQ(GetACLPrivilege((dir_ + "/none").c_str()), 0);
  EXPECT_EQ(GetACLPrivilege(dir_.c_str()), 7);
  EXPECT_TRUE(InOrdinaryChild([](const std::string&) { EXPECT_EQ(GetACLPrivilege("/usr"), 5); }));
  WriteFile(dir_ + "/file", "");
  EXPECT_EQ(NUVAACLIsSupport((dir_ + "/file").c_str(), -1, 2), 0);
  EXPECT_EQ(NUVAACLIsSupport("", -1, 2), 0);
  EXPECT_EQ(NUVAACLIsSupport((dir_ + "/none").c_str(), -1, 2), 0);
  const std::string set = "setfacl -m u:1:r " + dir_ + "/file 2>/dev/null";
  if (system(set.c_str()) != 0) GTEST_SKIP() << "needs setfacl and a file system with ACLs";
  EXPECT_EQ(NUVAACLIsSupport((dir_ + "/file").c_str(), -1, 2), 1);
}

TEST_F(IdentityTest, AForkLeadsASessionOfItsOwn) {
  EXPECT_TRUE(InChild([] {
    const pid_t child = NLIBCProcFork();
    if (child == 0) _exit(getsid(0) == getpid() ? 0 : 1);
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
  }));
}

class ConfineTest : public PlatformTest {
 protected:
  // Two volumes and the scratch volume, each with result folders of `user` and of another.
  void MakeResults(const std::string& user) {
    for (const char* volume : {"volume1", "volume2", "state/volume0"}) {
      for (const std::string& owner : {user, user + "2"}) {
        const std::string folder =
            MakeFolder(volume + std::string("/@tmp/webfm/FBSearch/") + owner, 0777);
        WriteFile(folder + "/db", "x");
        ASSERT_EQ(chmod((folder + "/db").c_str(), 0666), 0);
        ASSERT_EQ(chmod((folder + "/..").c_str(), 0777), 0);
      }
      WriteFile(MakeFolder(volume + std::string("/photo"), 0777) + "/keep", "x");
    }
  }

  std::set<std::string> Files() {
    std::set<std::string> files;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(dir_)) {
      if (entry.is_regular_file()) files.insert(entry.path());
    }
    return files;
  }
};

TEST(SandboxNames, EachVolumeHasOneThatThePatternMatches) {
  using Names = std::map<std::string, std::string>;
  const std::pair<std::vector<std::string>, Names> rows[] = {
      {{}, {{"/s", "/volume0"}}},
      {{"/volume1", "/volume2"},
       {{"/s", "/volume0"}, {"/volume1", "/volume1"}, {"/volume2", "/volume2"}}},
      {{"/volume0", "/volumeUSB"},
       {{"/s", "/volume1"}, {"/volume0", "/volume0"}, {"/volumeUSB", "/volumeUSB"}}},
      {{"/a/volume1", "/b", "/volume1"},
       {{"/s", "/volume0"},
        {"/a/volume1", "/volume2"},
        {"/b", "/volume3"},
        {"/volume1", "/volume1"}}},
  };
  for (const auto& [volumes, names] : rows) EXPECT_EQ(nas::NamesInSandbox(volumes, "/s"), names);
}

TEST_F(ConfineTest, CleanAllRemovesPreciselyTheUsersResults) {
  const std::string user = "o'neil $(touch x)";
  MakeResults(user);
  char word[256];
  ASSERT_EQ(NLIBCEncShParam(user.c_str(), word, sizeof word), 0);
  const std::string command =
      std::string("rm -rf /volume*/@tmp/webfm/FBSearch/") + word + " /volume*/photo " + dir_;
  std::set<std::string> expected = Files();
  EXPECT_GT(std::erase_if(expected,
                          [&](const std::string& file) {
                            return file.find("/" + user + "/") != std::string::npos;
                          }),
            0U);
  const auto run = [&] {
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", command.c_str(), nullptr, 0), 0);
    const uid_t uid = geteuid();
    ExpectIds(uid, uid, uid, getegid());
  };
  if (AmRoot()) {
    EXPECT_TRUE(InChild([&] {
      ASSERT_EQ(WfmLibUGIDSet(nullptr, kOtherUser), 0);
      run();
      EXPECT_NE(geteuid(), 0U);
    }));
  } else {
    EXPECT_TRUE(InChild(run));
  }
  EXPECT_EQ(Files(), expected);
}

// The user can empty the folder that root made, but not remove it.
TEST_F(ConfineTest, WhatACommandHasEmptiedIsRemoved) {
  SKIP_UNLESS_ROOT();
  MakeFolder("volume1");
  const std::string all = dir_ + "/volume1/@tmp/webfm/FBSearch/";
  const std::pair<const char*, bool> rows[] = {
      {"rm -rf /volume*/@tmp/webfm/FBSearch/nobody", false},
      {"true", true},
      {"rm -rf /volume*/@tmp/webfm/FBSearch/nobody/a*", true},
  };
  for (const auto& [command, there] : rows) {
    EXPECT_TRUE(InChild([&] {
      ASSERT_TRUE(nas::EnterUserState(kOtherUser));
      for (const std::string& volume : {dir_ + "/volume1", nas::ScratchVolume()}) {
        const auto folder = nas::MakeResultFolder(volume, kOtherUser);
        ASSERT_TRUE(folder);
        WriteFile(*folder + "/a.db", "x");
        WriteFile(*folder + "/b.db", "x");
      }
      NLIBCExec("/bin/sh", "-c", command, nullptr, 0);
      const uid_t uid = geteuid();
      ExpectIds(uid, uid, uid, getegid());
    }));
    for (const std::string& place : {all, nas::ScratchVolume() + "/@tmp/webfm/FBSearch/"}) {
      EXPECT_EQ(std::filesystem::exists(place + kOtherUser), there) << command;
    }
  }
}

TEST_F(ConfineTest, ACommandSeesAndWritesNothingElse) {
  MakeResults("ann");
  const std::tuple<const char*, int, const char*> rows[] = {
      {"exit 0", 0, "runs"},
      {"exit 7", 7, "gives its own status"},
      {"kill -9 $$", 128 + 9, "killed"},
      {"test -d /volume0/@tmp && test -d /volume1/@tmp && test -d /volume2/@tmp", 0,
       "the scratch volume is /volume0, others have unused numbers"},
      {"touch /volume1/x || touch /usr/x || touch /etc/x", 1, "only @tmp is writable"},
      {"touch /volume1/@tmp/webfm/FBSearch/ann/y", 0, "and it is"},
      {"test -e /home || test -e /root || test -e /proc || test -e /tmp", 1, "nothing else"},
      {"test -n \"$SECRET\"", 1, "no environment"},
      {"ls /dev/fd/ 2>/dev/null; true <&5", 2, "no descriptor"},
  };
  for (const auto& [command, status, why] : rows) {
    EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
      setenv("SECRET", "x", 1);
      EXPECT_EQ(NLIBCExec("/bin/sh", "-c", command, nullptr, 0), status);
    })) << why;
  }
  EXPECT_TRUE(InOrdinaryChild([](const std::string&) {
    EXPECT_EQ(NLIBCExec("/no/such/program", nullptr, nullptr, nullptr, 0), -1) << "not run";
  }));
}

}  // namespace
}  // namespace nas_test
