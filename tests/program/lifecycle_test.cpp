// The life of a search: killed, stopped, cleaned, interrupted, and what each leaves behind.

#include <sys/inotify.h>
#include <sys/prctl.h>

#include "arbory/running_search.h"
#include "nas/base/unique_fd.h"
#include "nas/system/user_state.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::UnorderedElementsAreArray;

class Lifecycle : public ProgramTest {
 protected:
  void SetUp() override {
    ProgramTest::SetUp();
    for (const char* name : {"one.txt", "two.txt", "three.jpg"})
      WriteFile(share_ + "/" + name, "x");
  }

  // A search that finds its names at once and then reads on and on.
  std::string StartEndless() {
    MakeEndlessFile(share_ + "/endless.log");
    return Start(Json_(R"({"folder_path": "/share", "pattern": "one", "search_content": true})"));
  }
  std::string StartQuick(const std::string& pattern) {
    Json::Value params = Json_(R"({"folder_path": "/share", "search_content": false})");
    params["pattern"] = pattern;
    const std::string id = Start(params);
    ListToEnd(id);
    return id;
  }
  bool Reaches(const std::string& id, const std::string& stage) {
    return Eventually([&] {
      const Json::Value data = TaskProperty(id, "data");
      const Json::Value walk = TaskProperty(id, "walk");
      if (stage == "started") return data.isObject() && data.isMember("pid");
      if (stage == "located") return data.isObject() && data.isMember("sdbid");
      return walk.isObject() && walk["phase"].asString() == stage;
    });
  }
  // The id of the one search that the user has, once it walks.
  std::string OneThatWalks(const std::string& user) {
    std::vector<std::string> ids;
    EXPECT_TRUE(Eventually([&] {
      ids = arbory::UnfinishedSearches(user);
      return ids.size() == 1 && !arbory::ReadSearch(user, ids.front()).walk.isNull();
    }));
    return ids.empty() ? std::string() : ids.front();
  }
  pid_t Worker(const std::string& id) { return TaskProperty(id, "data")["pid"].asInt(); }
  static bool Lives(pid_t process) {
    const std::string stat = nas_test::ReadFile("/proc/" + std::to_string(process) + "/stat");
    return stat != "(none)" && stat.find(") Z") == std::string::npos;
  }
  // The program's first child, once it is one that stays: calls end, who waits to clean up does
  // not.
  static pid_t ChildThatStays(pid_t program) {
    const std::string name = std::to_string(program);
    pid_t child = 0;
    EXPECT_TRUE(Eventually([&] {
      const pid_t before = std::exchange(child, 0);
      std::istringstream(nas_test::ReadFile("/proc/" + name + "/task/" + name + "/children")) >>
          child;
      usleep(500'000);
      return child > 0 && child == before;
    }));
    return child;
  }
  static Json::Value Id(const std::string& id) {
    Json::Value params;
    params["taskid"] = id;
    return params;
  }
};

// Which files of these folders are removed, in order.
class Removals {
 public:
  explicit Removals(const std::vector<std::string>& folders) {
    for (const std::string& folder : folders) {
      EXPECT_GE(inotify_add_watch(events_.get(), folder.c_str(), IN_DELETE), 0) << folder;
    }
  }
  // Of the files named by an id: databases and records, without what lies beside them.
  std::vector<std::string> Suffixes() const {
    std::vector<std::string> suffixes;
    alignas(inotify_event) char bytes[size_t{1} << 14];
    const ssize_t count = read(events_.get(), bytes, sizeof bytes);
    for (ssize_t at = 0; at < count;) {
      const auto* event = reinterpret_cast<const inotify_event*>(bytes + at);
      const std::string suffix = fs::path(event->name).extension();
      if (suffix == ".db" || suffix == ".json") suffixes.push_back(suffix);
      at += static_cast<ssize_t>(sizeof *event + event->len);
    }
    return suffixes;
  }

 private:
  nas::UniqueFd events_{inotify_init1(IN_NONBLOCK | IN_CLOEXEC)};
};

TEST_F(Lifecycle, AKilledWorkerLeavesAFinishedSearchThatCanBeCleaned) {
  for (const std::string stage : {"contents", "located", "started"}) {
    SCOPED_TRACE(stage);
    const std::string id = StartEndless();
    ASSERT_TRUE(Reaches(id, stage));
    ASSERT_EQ(kill(Worker(id), SIGKILL), 0);
    const Reply list = ListToEnd(id);
    // Killed before it had a result database, there is nothing to list, and that is said at once.
    EXPECT_TRUE(list.code == 0 || (list.code == 600 && stage == "started"));
    EXPECT_EQ(TaskProperty(id, "progress"), 0);
    EXPECT_EQ(Call("stop", Id(id)).code, 0);
    EXPECT_EQ(Call("clean", Id(id)).code, 0);
    EXPECT_TRUE(Eventually([&] { return TaskProperty(id, "data") == "gone"; }));
    // A database that was made but not yet named in the task goes with the day's sweep.
    EXPECT_TRUE(stage == "started" || Eventually([&] { return Remains().empty(); }));
  }
}

TEST_F(Lifecycle, StopEndsTheWorkerAndKeepsWhatWasFound) {
  prctl(PR_SET_CHILD_SUBREAPER, 1);  // the worker becomes this process's child
  const std::string id = StartEndless();
  prctl(PR_SET_CHILD_SUBREAPER, 0);
  ASSERT_TRUE(Reaches(id, "contents"));
  const pid_t worker = Worker(id);
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_EQ(Call("stop", Id("00000000000000000000000000000000," + id)).code, 0);
  int status = -1;
  EXPECT_TRUE(Eventually([&] { return waitpid(worker, &status, WNOHANG) == worker; }));
  EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(2));
  EXPECT_EQ(status, 0) << "told to stop, it ends by itself";
  const Reply list = ListToEnd(id);
  ASSERT_EQ(list.data["files"].size(), 1U);
  EXPECT_EQ(list.data["files"][0]["name"], "one.txt");
  EXPECT_EQ(TaskProperty(id, "progress"), 0);
  const char* const failure = "Failed To parse the find parameters";
  EXPECT_THAT(Logged(), Not(HasSubstr(failure))) << "a search that was stopped has not failed";
  ListToEnd(Start(Json_(R"({"folder_path": "/spoon", "pattern": "one"})")));
  EXPECT_THAT(Logged(), HasSubstr(failure));
}

// Stopped before its worker has come to anything, a search still tells where its results are: it
// can be listed, and cleaning it leaves nothing.
TEST_F(Lifecycle, AStopRightAfterTheStartLosesNothing) {
  constexpr int kRounds = 20;
  std::string ids;
  MakeEndlessFile(share_ + "/endless.log");
  const Json::Value search =
      Json_(R"({"folder_path": "/share", "pattern": "one", "search_content": true})");
  for (int round = 0; round < kRounds; ++round) {
    const std::string id = Start(search);
    EXPECT_EQ(Call("stop", Id(id)).code, 0);
    EXPECT_EQ(Call("list", Id(id)).code, 0) << "of round " << round;
    ids += id + ",";
  }
  EXPECT_EQ(Call("clean", Id(ids)).code, 0);
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));

  const std::string id = Start(search);
  EXPECT_EQ(Call("stop", Id(id)).code, 0);
  EXPECT_EQ(Call("clean", Id(id)).code, 0);
  EXPECT_TRUE(Eventually([&] { return TaskProperty(id, "data") == "gone"; }));
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); })) << "of one never listed";
}

TEST_F(Lifecycle, CleanRemovesTheSearchesItNamesAndNoOther) {
  const std::string first = StartQuick("one");
  const std::string running = StartEndless();
  ASSERT_TRUE(Reaches(running, "contents"));
  const std::string kept = StartQuick("two");
  const pid_t worker = Worker(running);
  Removals removals({nas::TaskFolder(nas_test::Me()),
                     fs::path(Databases(dir_ + "/volume1", nas_test::Me()).at(0)).parent_path()});
  EXPECT_EQ(Call("clean", Id(first + "," + running)).code, 0);
  EXPECT_TRUE(Eventually([&] {
    return TaskProperty(first, "data") == "gone" && TaskProperty(running, "data") == "gone";
  }));
  EXPECT_TRUE(Eventually([&] { return !Lives(worker); })) << "clean stops what it removes";
  EXPECT_EQ(Databases(dir_ + "/volume1", nas_test::Me()).size(), 1U);
  // Whoever sees the task can find the database, also when the cleaning is cut short.
  EXPECT_THAT(removals.Suffixes(), ElementsAre(".db", ".json", ".db", ".json"));
  const Reply gone = Call("list", Id(first));
  EXPECT_EQ(gone.data, Json_(R"({"finished": true})"));
  EXPECT_EQ(ListToEnd(kept).data["total"], 1);
}

TEST_F(Lifecycle, WhatCannotBeReadCanBeCleaned) {
  const std::string id = StartQuick("one");
  const std::string results = Databases(dir_ + "/volume1", nas_test::Me()).at(0);
  // A listing that was there when the worker ended leaves the log, which has all rows too.
  for (const char* part : {"-wal", "-shm", ""}) fs::remove(results + part);
  WriteFile(results, "no database");
  EXPECT_EQ(Call("list", Id(id)).code, 600);
  EXPECT_EQ(Call("clean", Id(id)).code, 0);
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
}

TEST_F(Lifecycle, CleanAllRemovesTheUsersResultFoldersAndNothingElse) {
  if (system("bwrap --unshare-all --ro-bind / / true 2>/dev/null") != 0) {
    GTEST_SKIP() << "bubblewrap cannot run here, so no shell command does";
  }
  MakeFolder("outside");
  StartQuick("one");
  const std::string temporary = dir_ + "/volume1/@tmp/webfm/FBSearch/";
  fs::create_directory(temporary + "somebody");
  WriteFile(temporary + "somebody/results", "theirs");
  WriteFile(share_ + "/results", "a file");
  ASSERT_EQ(Databases(dir_ + "/volume1", nas_test::Me()).size(), 1U);
  EXPECT_EQ(Call("Clean", Json_(R"({"action": "CleanAll"})")).code, 0);
  EXPECT_TRUE(Eventually([&] { return !fs::exists(temporary + nas_test::Me()); }));
  EXPECT_EQ(nas_test::ReadFile(temporary + "somebody/results"), "theirs");
  EXPECT_EQ(nas_test::ReadFile(share_ + "/results"), "a file");
}

TEST_F(Lifecycle, TooManyFoldersAreABadRequest) {
  Json::Value params = Json_(R"({"pattern": "one"})");
  for (int number = 0; number < 5000; ++number) params["folder_path"].append("/home/x");
  EXPECT_EQ(Call("start", params).code, 400);
  params["taskid"].swap(params["folder_path"]);
  EXPECT_EQ(Call("stop", params).code, 400);
}

// Not killed for it, or the search would look like a stopped one.
TEST_F(Lifecycle, AWorkerThatMayNotWriteSaysThatItFailed) {
  std::string id;
  {
    const nas_test::FullDisk full;
    id = Start(Json_(R"({"folder_path": "/share", "pattern": "one"})"));
  }
  ListToEnd(id);
  EXPECT_EQ(TaskProperty(id, "progress"), -1);
  EXPECT_EQ(TaskProperty(id, "data")["errno"], 401);
  EXPECT_TRUE(Databases(dir_ + "/volume1", nas_test::Me()).empty());
}

// Rows that cannot be purged, of links that lead nowhere, stand between those that can.
TEST_F(Lifecycle, FilesThatVanishedLeaveTheListing) {
  const auto name = [](int number) { return "many" + std::to_string(100 + number); };
  for (int number = 0; number < 30; ++number) {
    if (number % 10 == 4) {
      fs::create_symlink("nowhere", share_ + "/" + name(number));
    } else {
      WriteFile(share_ + "/" + name(number), "x");
    }
  }
  const std::string id = StartQuick("many");
  Json::Value params = Id(id);
  params["sort_by"] = "name";
  params["offset"] = 3;
  params["limit"] = 4;
  const auto page = [&] {
    const Reply reply = Call("list", params);
    EXPECT_EQ(reply.code, 0);
    std::vector<std::string> names;
    for (const Json::Value& file : reply.data["files"]) names.push_back(file["name"].asString());
    return names;
  };
  for (int number = 5; number < 14; ++number) fs::remove(share_ + "/" + name(number));
  EXPECT_THAT(page(), ElementsAre(name(3), name(4), name(14), name(15)));
  EXPECT_EQ(ListToEnd(id).data["total"], 21);
  fs::remove(share_ + "/" + name(3));
  {
    const nas_test::FullDisk full;
    EXPECT_THAT(page(), ElementsAre(name(4), name(14), name(15), name(16))) << "then too";
  }
}

// A file that merely cannot be reached for a while, here behind a loop of links, is listed again
// once it can.
TEST_F(Lifecycle, FilesOutOfReachStayInTheResults) {
  const std::string folder = MakeFolder("volume1/share/away");
  WriteFile(folder + "/distant.dat", "x");
  const std::string id = StartQuick("distant");
  fs::rename(folder, share_ + "/elsewhere");
  fs::create_symlink("away", folder);
  Call("list", Id(id));
  fs::remove(folder);
  fs::rename(share_ + "/elsewhere", folder);
  EXPECT_EQ(ListToEnd(id).data["total"], 1);
}

TEST_F(Lifecycle, HistoryIsWrittenByBothRoads) {
  const auto patterns = [&](const char* kind) {
    Json::Value params;
    params["search_type"] = kind;
    const Reply reply = CallHistory("get", params);
    EXPECT_EQ(reply.data["total"].asUInt(), reply.data["history"].size());
    std::vector<std::string> list;
    for (const Json::Value& record : reply.data["history"]) {
      list.push_back(record["pattern"].asString());
    }
    return list;
  };
  EXPECT_THAT(patterns("simple"), IsEmpty());
  StartQuick("first");
  StartQuick("second");
  EXPECT_EQ(CallHistory("set", Json_(R"({"pattern": "third"})")).code, 0);
  StartQuick("first");
  EXPECT_EQ(CallHistory("set", Json_(R"({"pattern": "x", "search_type": "advance"})")).code, 0);
  EXPECT_EQ(CallHistory("set", Json_(R"({"folder_path": "/share"})")).code, 401);
  EXPECT_THAT(patterns("simple"), ElementsAre("first", "third", "second"));
  // Neither road makes a second record of a pattern, nor an eleventh of all.
  EXPECT_EQ(CallHistory("set", Json_(R"({"pattern": "second"})")).code, 0);
  EXPECT_THAT(patterns("simple"), ElementsAre("second", "first", "third"));
  for (int number = 0; number < 9; ++number) {
    Json::Value record;
    record["pattern"] = "p" + std::to_string(number);
    EXPECT_EQ(CallHistory("set", record).code, 0);
  }
  EXPECT_THAT(patterns("simple"),
              ElementsAre("p8", "p7", "p6", "p5", "p4", "p3", "p2", "p1", "p0", "second"));
  StartQuick("third");
  EXPECT_THAT(patterns("simple"),
              ElementsAre("third", "p8", "p7", "p6", "p5", "p4", "p3", "p2", "p1", "p0"));
  EXPECT_EQ(CallHistory("delete", Json::Value()).code, 0);
  EXPECT_THAT(patterns("simple"), IsEmpty());
  EXPECT_THAT(patterns("advance"), ElementsAre("x"));
  const Json::Value settings =
      Json_(nas_test::ReadFile(nas::PreferenceFolder(nas_test::Me()) + "/usersettings"));
  EXPECT_EQ(settings["NUVA.VTX.App.PersonalSettings.Instance"]["search_count"], 4);
}

// However the user's home is named, it is searched once and shown under one name.
TEST_F(Lifecycle, HomesAreSearchedUnderOneName) {
  const std::string me = nas_test::Me();
  for (const std::string& folder : {"homes/" + me, "homes/" + me + "/docs", std::string("share")}) {
    WriteFile(MakeFolder("volume1/" + folder) + "/plan.txt", "x");
  }
  const std::vector<std::string> home = {"/home/plan.txt", "/home/docs/plan.txt"};
  const struct {
    std::string folders;
    std::string searched;
    std::vector<std::string> found;
  } rows[] = {
      {"/home", "/homes/" + me, home},
      {"/home,/homes/" + me, "/homes/" + me, home},
      {"/homes/" + me + "/docs,/home", "/homes/" + me, home},
      {"/homes,/home/docs", "/homes", home},
      {"/home/docs,/share", "/share /homes/" + me + "/docs", {"/share/plan.txt", home[1]}},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.folders);
    Json::Value params;
    params["folder_path"] = row.folders;
    params["pattern"] = "plan";
    const Reply reply = Call("start", params);
    EXPECT_EQ(reply.data["has_not_index_share"], true) << "no share has an index";
    const std::string id = reply.data["taskid"].asString();
    const Reply list = ListToEnd(id);
    std::vector<std::string> found;
    for (const Json::Value& file : list.data["files"]) found.push_back(file["path"].asString());
    EXPECT_THAT(found, UnorderedElementsAreArray(row.found));
    const Json::Value data = TaskProperty(id, "data");
    std::string searched;
    for (const Json::Value& folder : data["location"]) {
      searched += (searched.empty() ? "" : " ") + folder.asString();
    }
    EXPECT_EQ(searched, row.searched);
  }
}

// However the program is made to end, the search it ran is stopped and nothing of it stays.
TEST_F(Lifecycle, AnInterruptedProgramCleansUp) {
  MakeEndlessFile(share_ + "/endless.log");
  for (const int signal_number : {SIGINT, SIGTERM, SIGHUP}) {
    SCOPED_TRACE(strsignal(signal_number));
    const pid_t program = Launch({"search", "one", "--content"});
    const pid_t worker = Worker(OneThatWalks(nas_test::Me()));
    ASSERT_TRUE(Lives(worker));
    kill(program, signal_number);
    usleep(1000);  // two that wait at once would be one
    kill(program, signal_number);
    const Output output = Finish(program);
    EXPECT_EQ(output.exit_code, 130);
    EXPECT_TRUE(Eventually([&] { return !Lives(worker) && Remains().empty(); }));
  }
}

// Killed, the program can clean nothing up; another process does, also what has ended since, and
// whatever the program has begun lives on.
TEST_F(Lifecycle, WhatAKilledProgramHasFoundIsCleanedUp) {
  MakeEndlessFile(share_ + "/endless.log");
  const std::vector<std::string> runs = {"search", "one", "-x", "sh", "-c", "sleep 5"};
  const std::vector<std::string> reads = {"search", "one", "--content"};
  for (const auto& words : {runs, reads}) {
    SCOPED_TRACE(words.back());
    const size_t unfinished = words == reads ? 1 : 0;
    const pid_t program = Launch(words);
    ASSERT_TRUE(Eventually([&] {
      return !Databases(dir_ + "/volume1", nas_test::Me()).empty() &&
             arbory::UnfinishedSearches(nas_test::Me()).size() == unfinished;
    }));
    ChildThatStays(program);
    kill(program, SIGKILL);
    EXPECT_EQ(Finish(program).exit_code, -SIGKILL);
    EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
  }
}

// And where that process was killed too its search notices. As long as the program lives, even
// stopped as by Ctrl-Z or while its reader takes nothing, the search goes on.
TEST_F(Lifecycle, ASearchThatNobodyWantsEndsAndLeavesNothing) {
  const std::string config = dir_ + "/as-" + nas_test::Me() + "/arbory.toml";
  WriteFile(config, "lease_seconds = 1\n" + nas_test::ReadFile(config));
  MakeEndlessFile(share_ + "/endless.log");
  const pid_t program = Launch({"search", "one", "--content"});
  const pid_t worker = Worker(OneThatWalks(nas_test::Me()));
  const pid_t cleaner = ChildThatStays(program);
  kill(program, SIGSTOP);
  usleep(2'500'000);  // more than twice the lease
  EXPECT_TRUE(Lives(worker));
  EXPECT_EQ(kill(cleaner, SIGKILL), 0);
  kill(program, SIGKILL);
  EXPECT_EQ(Finish(program).exit_code, -SIGKILL);
  EXPECT_TRUE(Eventually([&] { return !Lives(worker) && Remains().empty(); }));
}

// Root's program for a user follows records that the user can write, and looks where they point: it
// must not see more there than the user, nor with root's groups.
TEST_F(Lifecycle, RootsProgramForAUserIsTheUser) {
  SKIP_UNLESS_ROOT();
  MakeEndlessFile(share_ + "/endless.log");
  const pid_t program = Launch({"search", "one", "--content", "--user", nas_test::kOtherUser});
  OneThatWalks(nas_test::kOtherUser);
  const std::string status = nas_test::ReadFile("/proc/" + std::to_string(program) + "/status");
  kill(program, SIGTERM);
  EXPECT_EQ(Finish(program).exit_code, 130);
  const passwd* user = getpwnam(nas_test::kOtherUser);
  const std::string uid = std::to_string(user->pw_uid);
  const std::string gid = std::to_string(user->pw_gid);
  EXPECT_THAT(status, HasSubstr("Uid:\t" + uid + "\t" + uid + "\t" + uid + "\t" + uid + "\n"));
  EXPECT_THAT(status, HasSubstr("Gid:\t" + gid + "\t" + gid + "\t" + gid + "\t" + gid + "\n"));
  EXPECT_THAT(status, HasSubstr("Groups:\t" + gid + " \n"));
  EXPECT_TRUE(Eventually([&] { return Remains(nas_test::kOtherUser).empty(); }));
}

// Two users of one machine: neither sees the other's searches, results or history.
TEST_F(Lifecycle, UsersAreStrangersToEachOther) {
  SKIP_UNLESS_ROOT();
  const char* const ann = "daemon";
  const char* const bob = "nobody";
  for (const char* user : {ann, bob}) {
    const std::string folder = MakeFolder("volume1/share/" + std::string(user));
    WriteFile(folder + "/secret.txt", user);
    const passwd* account = getpwnam(user);
    ASSERT_EQ(chown(folder.c_str(), account->pw_uid, account->pw_gid), 0);
    ASSERT_EQ(chmod(folder.c_str(), 0700), 0);
  }
  const Json::Value search = Json_(R"({"folder_path": "/share", "pattern": "secret"})");
  const std::string anns = Start(search, ann);
  const Reply hers = ListToEnd(anns, ann);
  ASSERT_EQ(hers.data["files"].size(), 1U);
  EXPECT_EQ(hers.data["files"][0]["path"], "/share/daemon/secret.txt");
  EXPECT_EQ(TaskProperty(anns, "walk", ann)["skipped"]["permission"], 1);

  EXPECT_EQ(Call("list", Id(anns), bob).data, Json_(R"({"finished": true})"));
  EXPECT_EQ(Call("stop", Id(anns), bob).code, 0);
  EXPECT_EQ(Call("clean", Id(anns), bob).code, 0);
  usleep(200'000);  // the cleaning goes on behind the reply
  EXPECT_EQ(ListToEnd(anns, ann).data["total"], 1) << "bob cleaned it";

  const std::string folder = nas::PreferenceFolder(ann);
  for (const std::string& path :
       {folder, nas::TaskFolder(ann), dir_ + "/volume1/@tmp/webfm/FBSearch/" + ann}) {
    EXPECT_EQ(nas_test::ModeOf(path), 0700U) << path;
  }
  Json::Value own;
  own["folder_path"] = "/share/daemon";
  own["pattern"] = "secret";
  const std::string bobs = Start(own, bob);
  EXPECT_EQ(ListToEnd(bobs, bob).code, 600);
  EXPECT_EQ(TaskProperty(bobs, "data", bob)["errno"], 407);
  const Output output = Run({"search", "secret", share_, "--user", "nobody"});
  EXPECT_EQ(output.out, share_ + "/nobody/secret.txt\n");
  EXPECT_EQ(output.err, "arbory: 1 folder could not be read (permission denied)\n");
}

}  // namespace
}  // namespace program_test
