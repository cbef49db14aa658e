// Configuration files, shares, volumes and what is kept per user.

#include <cstdlib>
#include <sstream>

#include "nas/base/accounts.h"
#include "nas/system/config.h"
#include "nas/system/shares.h"
#include "nas/system/user_state.h"
#include "nas/system/volumes.h"
#include "platform/system.h"
#include "platform/webfm.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

class ConfigTest : public PlatformTest {
 protected:
  // The error's text after "FILE", or "" when the configuration is good.
  std::string Trouble(const std::string& content) {
    const std::string file = dir_ + "/arbory.toml";
    WriteFile(file, content);
    try {
      nas::Configure(nas::LoadConfig(file));
      return "";
    } catch (const nas::ConfigError& error) {
      const std::string what = error.what();
      return what.starts_with(file) ? what.substr(file.size()) : "no file in: " + what;
    }
  }
};

TEST_F(ConfigTest, NamesTheLineOfTheTrouble) {
  const struct {
    const char* content;
    const char* trouble;  // its beginning
  } rows[] = {
      {"", ""},
      {"state_dir = \"/s\"\nvolumes = []\nmodule = \"/m.so\"\n[shares]\na = \"/tmp\"\n", ""},
      {"# c\nstate-dir = \"/s\"\n", ":2: unknown key \"state-dir\""},
      {"state_dir = 5\n", ":1: a text"},
      {"\n\nstate_dir = \"s\"\n", ":3: an absolute path"},
      {"volumes = \"/volume*\"\n", ":1: a list"},
      {"volumes = [\n\"/a\",\n7]\n", ":3: a text"},
      {"shares = 1\n", ":1: a table"},
      {"[shares]\n\na = true\n", ":3: a text"},
      {"[shares]\na = \"relative\"\n", ":2: an absolute path"},
      {"[shares]\na = \"/tmp\"\nhome = \"/tmp\"\n", ":3: share \"home\": the name stands for"},
      {"[shares]\n\"a,b\" = \"/tmp\"\n", ":2: share \"a,b\": the name holds"},
      {"[shares]\nb = \"/x/homes/y\"\n", ":2: share \"b\": its directory lies in"},
      {"state_dir = \"/s\"\nstate_dir = \"/t\"\n", ":2: "},
      {"[shares\n", ":1: "},
      {"searches_per_user = 3\n[server]\nlisten = \"[::1]:1\"\nbehind_tls = true\n"
       "origins = [\"https://nas\"]\nmax_calls = 1\nidle_seconds = 1000000000\n",
       ""},
      {"server = 1\n", ":1: a table"},
      {"[server]\nmax_cals = 5\n", ":2: unknown key \"max_cals\""},
      {"[server]\nmax_calls = 0\n", ":2: a number from 1"},
      {"[server]\nmax_calls = 1000000001\n", ":2: a number from 1"},
      {"[server]\nmax_calls = \"5\"\n", ":2: a number from 1"},
      {"[server]\nbehind_tls = 1\n", ":2: true or false"},
      {"[server]\norigins = \"https://nas\"\n", ":2: a list"},
      {"[server]\norigins = [\"http://nas:80\",\n\"https://nas/\"]\n",
       ":3: an address without a path"},
      {"[server]\norigins = [\"nas\"]\n", ":2: an address without a path"},
      {"[server]\nweb_dir = \"web\"\n", ":2: an absolute path"},
      {"[fleet]\nlowest_uid = 500\n", ":1: the name"},
      {"[fleet]\nname = \"home\"\n", ":2: a name"},
      {"[fleet]\nname = \"a/b\"\n", ":2: a name"},
      {"[fleet]\nname = \"b\"\n[fleet.fronts.o]\nusers = []\n", ":3: the front's public key"},
      {"[fleet]\nname = \"b\"\n[fleet.fronts.o]\nkey = \"6B\"\n", ":4: 64 hexadecimal"},
  };
  for (const auto& row : rows) {
    const std::string trouble = Trouble(row.content);
    EXPECT_TRUE(row.trouble[0] == '\0' ? trouble.empty() : trouble.starts_with(row.trouble))
        << row.content << " -> " << trouble;
  }
  EXPECT_THROW(nas::LoadConfig(dir_ + "/missing.toml"), nas::ConfigError);
  EXPECT_THROW(nas::LoadConfig(dir_), nas::ConfigError);
}

// An administrator takes the comment's mark away and has what stands there: nothing but the
// default.
TEST_F(ConfigTest, TheSampleShowsTheDefaults) {
  const std::string guide = ReadFile(ARBORY_SOURCE_DIR "/docs/deploy.md");
  std::istringstream sample(ReadFile(ARBORY_SOURCE_DIR "/packaging/arbory.toml"));
  std::string all, table;
  for (std::string line; std::getline(sample, line);) {
    if (line.starts_with('[')) table = line + "\n";
    const size_t mark = line.find(" = ");
    const bool is_key =
        mark != std::string::npos && line.starts_with("# ") && line.find(' ', 2) == mark;
    if (is_key) line = line.substr(2);
    all += line + "\n";
    if (!is_key) continue;
    EXPECT_EQ(Trouble(table + line + "\n"), "") << line;
    if (table == "[shares]\n") continue;
    EXPECT_NE(guide.find("`" + line.substr(0, mark - 2)), std::string::npos) << line;
  }
  ASSERT_EQ(Trouble(all), "");
  nas::Config config = nas::CurrentConfig();
  EXPECT_EQ(config.shares.size(), 2U);
  config.shares.clear();
  config.state_dir = nas::DefaultConfig().state_dir;  // another for whom is not root
  EXPECT_EQ(config, nas::DefaultConfig());
}

TEST_F(ConfigTest, FindsTheFileByTheEnvironment) {
  const std::string base = MakeFolder("xdg");
  MakeFolder("xdg/arbory");
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    setenv("XDG_CONFIG_HOME", base.c_str(), 1);
    setenv("XDG_STATE_HOME", (dir_ + "/mine").c_str(), 1);
    unsetenv("ARBORY_CONFIG");
    EXPECT_EQ(nas::LoadConfig("").state_dir, dir_ + "/mine/arbory");
    setenv("ARBORY_CONFIG", (dir_ + "/none").c_str(), 1);
    EXPECT_THROW(nas::LoadConfig(""), nas::ConfigError) << "a named file must exist";
  }));
  WriteFile(base + "/arbory/arbory.toml", "state_dir = \"/x\"");
  WriteFile(dir_ + "/env", "state_dir = \"/e\"");
  EXPECT_TRUE(InChild([&] {
    setenv("XDG_CONFIG_HOME", base.c_str(), 1);
    if (access("/etc/arbory/arbory.toml", F_OK) != 0) {
      EXPECT_EQ(nas::LoadConfig("").state_dir, "/x");
    }
    setenv("ARBORY_CONFIG", (dir_ + "/env").c_str(), 1);
    EXPECT_EQ(nas::LoadConfig("").state_dir, "/e");
  }));
}

class SharesTest : public PlatformTest {};

TEST_F(SharesTest, FollowTheirTable) {
  for (const char* folder : {"volume1/photo", "volume2/photo", "volume2/music", "volume1/@tmp",
                             "volume1/.hidden", "volume1/#recycle", "volume1/home", "volume1/a,b",
                             "volume2/homes/ann", "elsewhere/below"}) {
    MakeFolder(folder);
  }
  WriteFile(dir_ + "/volume1/file", "");
  ASSERT_EQ(symlink("/", (dir_ + "/volume1/link").c_str()), 0);
  ASSERT_EQ(symlink("elsewhere/below", (dir_ + "/detour").c_str()), 0);
  Configure({{"all", "/"},
             {"far", dir_ + "/detour"},
             {"music", dir_ + "/volume1/photo/"},
             {"later", dir_ + "/later"}});
  const struct {
    const char* name;
    const char* root;    // below dir_
    const char* volume;  // below dir_
  } rows[] = {
      {"photo", "/volume1/photo", "/volume1"},
      {"music", "/volume1/photo", "/volume1"},  // configured before a volume's own
      {"far", "/elsewhere/below", nullptr},
      {"homes", "/volume2/homes", "/volume2"},
  };
  for (const auto& row : rows) {
    const auto share = nas::FindShare(row.name);
    ASSERT_TRUE(share) << row.name;
    EXPECT_EQ(share->root, dir_ + row.root) << row.name;
    EXPECT_EQ(share->volume, row.volume == nullptr ? "" : dir_ + row.volume) << row.name;
  }
  for (const char* none : {"later", "@tmp", ".hidden", "#recycle", "home", "a,b", "file", "link",
                           "..", "", "photo/..", "PHOTO"}) {
    EXPECT_FALSE(nas::FindShare(none)) << none;
  }
  EXPECT_EQ(nas::FindShare("all")->root, "");
  std::string names;
  for (const nas::Share& share : nas::ListShares()) names += share.name + " ";
  EXPECT_EQ(names, "all far homes music photo ");
  MakeFolder("later");
  EXPECT_TRUE(nas::FindShare("later")) << "seen as soon as it is there";

  char home[4096];
  EXPECT_EQ(NUVAServiceHomePathGet("ann", home, sizeof home), 0);
  EXPECT_EQ(home, dir_ + "/volume2/homes/ann");
  EXPECT_EQ(NUVAServiceHomePathGet("ann", home, dir_.size()), -1) << "does not fit";
  for (const char* user : {"bob", "..", "", "ann/.."}) {
    EXPECT_EQ(NUVAServiceHomePathGet(user, home, sizeof home), -1) << user;
    EXPECT_EQ(errno, ENOENT) << user;
  }
}

TEST_F(SharesTest, ThatCannotBeOfferedAreRefused) {
  MakeFolder("homes/x");
  MakeFolder("data/homes");
  ASSERT_EQ(symlink("homes/x", (dir_ + "/innocent").c_str()), 0);
  const std::tuple<const char*, const char*, bool> rows[] = {
      {"homes", "/homes", true},    {"homes", "/homes/", true}, {"homes", "/data", false},
      {"homes", "/homes/x", false}, {"data", "/data", true},    {"h", "/homes", false},
      {"x", "/homes/x", false},     {"x", "/innocent", false},  {"", "/data", false},
      {"a/b", "/data", false},      {"a\nb", "/data", false},   {"..", "/data", false},
  };
  for (const auto& [name, directory, good] : rows) {
    if (good) {
      EXPECT_NO_THROW(Configure({{name, dir_ + directory}})) << name << directory;
    } else {
      EXPECT_THROW(Configure({{name, dir_ + directory}}), nas::ConfigError)
          << name << " " << directory;
    }
  }
  EXPECT_THROW(Configure({{"a", dir_}, {"a", dir_}}), nas::ConfigError) << "twice";
  EXPECT_THROW(Configure({{"a", ""}}), nas::ConfigError) << "no directory";
}

class UserStateTest : public PlatformTest {};

TEST_F(UserStateTest, IsMadeOnceAndPrivate) {
  umask(0077);  // what is made must not depend on it
  for (const std::string& user :
       AmRoot() ? std::vector<std::string>{Me(), kOtherUser} : std::vector<std::string>{Me()}) {
    const auto enter = [&] { EXPECT_TRUE(nas::EnterUserState(user)) << user; };
    ASSERT_TRUE(InChild(enter));
    const std::string preference = nas::PreferenceFolder(user);
    EXPECT_EQ(ReadFile(preference + "/usersettings"), "{}\n");
    EXPECT_EQ(ModeOf(preference + "/usersettings"), 0600U);
    for (const std::string& folder : {preference, preference + "/..", nas::TaskFolder(user)}) {
      EXPECT_EQ(ModeOf(folder), 0700U) << folder;
      struct stat info;
      stat(folder.c_str(), &info);
      EXPECT_EQ(info.st_uid, nas::FindAccount(user)->uid) << folder;
    }
    WriteFile(preference + "/usersettings", "kept");
    ASSERT_TRUE(InChild(enter));
    EXPECT_EQ(ReadFile(preference + "/usersettings"), "kept");
    for (const std::string& folder : {preference, nas::TaskFolder(user)}) {
      std::filesystem::remove_all(folder);
      ASSERT_TRUE(InChild(enter)) << "what is missing is made again";
      EXPECT_EQ(ModeOf(folder), 0700U);
    }
  }
  EXPECT_EQ(ModeOf(state_), AmRoot() ? 0755U : 0700U);
}

TEST_F(UserStateTest, IsRefusedWhereItIsNotTheUsersOwn) {
  for (const char* name : {"", ".", "..", "../x", "a/b", "no-such-user-here", "a\nb"}) {
    const nas::Status status = nas::EnterUserState(name);
    ASSERT_FALSE(status) << name;
    EXPECT_EQ(status.error().kind, nas::kErrorUnknownUser) << name;
  }
  ASSERT_TRUE(nas::EnterUserState(Me()));
  const std::string preference = nas::PreferenceFolder(Me());
  ASSERT_EQ(chmod(preference.c_str(), 0750), 0);
  const nas::Status open_to_group = nas::EnterUserState(Me());
  ASSERT_FALSE(open_to_group);
  EXPECT_EQ(open_to_group.error().kind, nas::kErrorPermission);
  ASSERT_EQ(rename(preference.c_str(), (dir_ + "/moved").c_str()), 0);
  ASSERT_EQ(chmod((dir_ + "/moved").c_str(), 0700), 0);
  ASSERT_EQ(symlink((dir_ + "/moved").c_str(), preference.c_str()), 0);
  EXPECT_FALSE(nas::EnterUserState(Me())) << "a link";
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    const nas::Status others = nas::EnterUserState("root");
    ASSERT_FALSE(others) << "another user's";
    EXPECT_EQ(others.error().error_number, EPERM);
  }));
}

class ResultFolderTest : public PlatformTest {};

TEST_F(ResultFolderTest, LiesOnTheVolumeOrInTheScratchVolume) {
  const std::string share = MakeFolder("volume1/photo");
  Configure({{"far", MakeFolder("far")}});
  ASSERT_TRUE(nas::EnterUserState(Me()));
  const std::string volume = dir_ + "/volume1";
  EXPECT_FALSE(nas::ResultFolder(volume, Me())) << "reading makes nothing";
  EXPECT_FALSE(std::filesystem::exists(volume + "/@tmp"));
  EXPECT_EQ(*nas::ResultVolume(nas::FindShare("photo")->volume, Me()), volume);
  EXPECT_EQ(*nas::ResultVolume(nas::FindShare("far")->volume, Me()), nas::ScratchVolume());
  for (const std::string& on : {volume, nas::ScratchVolume()}) {
    EXPECT_EQ(*nas::ResultFolder(on, Me()), on + "/@tmp/webfm/FBSearch/" + Me());
    EXPECT_EQ(ModeOf(on + "/@tmp/webfm/FBSearch"), AmRoot() ? 0755U : 01777U);
    EXPECT_EQ(ModeOf(on + "/@tmp/webfm/FBSearch/" + Me()), 0700U);
  }
  for (const std::string& other : {dir_ + "/far", std::string("/"), volume + "/photo", volume + "/",
                                   volume + "/../volume1", dir_ + "/volume2"}) {
    EXPECT_FALSE(nas::MakeResultFolder(other, Me())) << "no volume: " << other;
  }
  EXPECT_FALSE(nas::MakeResultFolder(volume, "../x"));
}

TEST_F(ResultFolderTest, IsNotTakenFromOthers) {
  MakeFolder("volume1");
  ASSERT_TRUE(nas::EnterUserState(Me()));
  const std::string volume = dir_ + "/volume1";
  const auto made = nas::MakeResultFolder(volume, Me());
  ASSERT_TRUE(made);
  const std::string mine = *made;
  const struct {
    const char* why;
    std::function<void()> spoil;
  } rows[] = {
      {"open to others", [&] { ASSERT_EQ(chmod(mine.c_str(), 0711), 0); }},
      {"a link",
       [&] {
         ASSERT_EQ(rmdir(mine.c_str()), 0);
         ASSERT_EQ(symlink(MakeFolder("trap", 0700).c_str(), mine.c_str()), 0);
       }},
      {"a folder on the way that anybody can replace",
       [&] {
         ASSERT_EQ(unlink(mine.c_str()), 0);
         ASSERT_EQ(chmod((volume + "/@tmp").c_str(), 0777), 0);
       }},
  };
  for (const auto& row : rows) {
    row.spoil();
    for (const auto& refused :
         {nas::ResultFolder(volume, Me()), nas::MakeResultFolder(volume, Me())}) {
      ASSERT_FALSE(refused) << row.why;
      EXPECT_EQ(refused.error().error_number, EPERM) << row.why;
    }
  }
  EXPECT_EQ(*nas::ResultVolume(volume, Me()), nas::ScratchVolume()) << "then the scratch volume";
}

// Where the folder of folders was made for all to write in, somebody could be first.
TEST_F(ResultFolderTest, IsNotBlockedByWhatAnotherUserPutThere) {
  SKIP_UNLESS_ROOT();
  constexpr uid_t kStranger = 2;
  const std::string volume = MakeFolder("volume1");
  const std::string trap = MakeFolder("trap", 0700);
  WriteFile(trap + "/kept", "kept");
  const std::string all = MakeFolder("volume1/@tmp/webfm/FBSearch", 01777);
  const std::string place = all + "/" + kOtherUser;
  const struct {
    const char* why;
    std::function<int()> plant;
    uid_t owner;
  } rows[] = {
      {"nothing", [] { return 0; }, kStranger},
      {"a folder", [&] { return mkdir(place.c_str(), 0777); }, kStranger},
      {"a folder with something in it",
       [&] { return mkdir(place.c_str(), 0777) + mkdir((place + "/x").c_str(), 0777); }, kStranger},
      {"a link", [&] { return symlink(trap.c_str(), place.c_str()); }, kStranger},
      {"a file", [&] { return mkfifo(place.c_str(), 0666); }, kStranger},
      {"root's own, just being made", [&] { return mkdir(place.c_str(), 0700); }, 0},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    std::filesystem::remove_all(place);
    ASSERT_EQ(chmod(all.c_str(), 01777), 0);
    ASSERT_EQ(row.plant(), 0);
    (void)lchown(place.c_str(), row.owner, row.owner);
    EXPECT_TRUE(InChild([&] {
      EXPECT_FALSE(nas::MakeResultFolder(volume, kOtherUser)) << "root is not that user";
      ASSERT_TRUE(nas::EnterUserState(kOtherUser));
      const auto folder = nas::MakeResultFolder(volume, kOtherUser);
      ASSERT_TRUE(folder) << folder.error().Text();
      EXPECT_NE(geteuid(), 0U) << "stepped down again";
      EXPECT_TRUE(nas::MakeResultFolder(nas::ScratchVolume(), kOtherUser));
      WriteFile(*folder + "/results", "mine");
      EXPECT_EQ(mkdir((all + "/somebody").c_str(), 0700), -1) << "only root makes folders there";
      EXPECT_EQ(rmdir(place.c_str()), -1);
    }));
    EXPECT_EQ(ReadFile(place + "/results"), "mine");
    EXPECT_EQ(ModeOf(place), 0700U);
    EXPECT_EQ(ModeOf(all), 0755U);
    EXPECT_EQ(ReadFile(trap + "/results"), "(none)");
  }
}

// What the user cannot reach must not be found by going back to root.
TEST_F(ResultFolderTest, IsLookedAtAsTheUser) {
  SKIP_UNLESS_ROOT();
  const std::string volume = MakeFolder("volume1");
  const auto refused = [](const auto& result) {
    return !result && result.error().error_number == EACCES;
  };
  EXPECT_TRUE(InChild([&] {
    ASSERT_TRUE(nas::EnterUserState(kOtherUser));
    ASSERT_TRUE(nas::MakeResultFolder(volume, kOtherUser));
  }));
  ASSERT_EQ(chmod(volume.c_str(), 0700), 0);
  EXPECT_TRUE(InChild([&] {
    ASSERT_TRUE(nas::EnterUserState(kOtherUser));
    EXPECT_TRUE(refused(nas::ResultFolder(volume, kOtherUser)));
  }));
  ASSERT_EQ(chmod(state_.c_str(), 0700), 0);
  EXPECT_TRUE(InChild([&] { EXPECT_TRUE(refused(nas::EnterUserState(kOtherUser))); }));
}

}  // namespace
}  // namespace nas_test
