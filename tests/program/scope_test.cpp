// What a run of the terminal's search does beside the query: it waits for a place among its user's
// searches, tells what it could not read, and takes times of every century.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>

#include <cstdio>
#include <filesystem>

#include "nas/system/config.h"
#include "platform/task_record.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

namespace fs = std::filesystem;

class Scope : public ProgramTest {
 protected:
  // Searches that hold all places of the user and do nothing.
  std::vector<std::string> TakeAllPlaces() {
    fs::create_directories(share_ + "/endless");
    MakeEndlessFile(share_ + "/endless/file");
    std::vector<std::string> running;
    for (int i = 0; i < nas::CurrentConfig().searches_per_user; ++i) {
      running.push_back(Start(Json_(R"({"folder_path": "/share/endless", "pattern": "zzz",
                                        "search_content": true})")));
      // Not while it has a lock that others wait for.
      EXPECT_TRUE(Eventually([&] {
        return TaskProperty(running.back(), task_record::kData).isMember(task_record::kDatabaseId);
      }));
      EXPECT_EQ(kill(Worker(running.back()), SIGSTOP), 0);
    }
    return running;
  }
  pid_t Worker(const std::string& id) {
    return TaskProperty(id, task_record::kData)[task_record::kPid].asInt();
  }
  void End(const std::string& id) {
    kill(Worker(id), SIGCONT);
    Json::Value task;
    task["taskid"] = id;
    EXPECT_EQ(Call("stop", task).code, 0);
    EXPECT_EQ(Call("clean", task).code, 0);
  }
};

// On a terminal it says that it waits; where nobody watches nothing is said.
TEST_F(Scope, OneSearchTooManyWaitsForAPlace) {
  fs::create_directories(share_ + "/plain");
  WriteFile(share_ + "/plain/a.txt", "");
  const std::vector<std::string> running = TakeAllPlaces();
  const pid_t unwatched = Launch({"search", "-0", "a.txt", share_ + "/plain"});
  const std::string line = "cd " + share_ + " && ARBORY_CONFIG=" + dir_ + "/as-" + nas_test::Me() +
                           "/arbory.toml script -qec '" + program_ +
                           " search --color never a.txt plain' /dev/null </dev/null";
  FILE* const watched = popen(line.c_str(), "r");
  ASSERT_NE(watched, nullptr);
  std::string said;
  const auto hear = [&] {
    const int c = std::getc(watched);
    if (c != EOF) said.push_back(static_cast<char>(c));
    return c != EOF;
  };
  while (said.find('\n') == std::string::npos && hear()) {
  }
  EXPECT_EQ(said,
            "arbory: waiting for one of 8 searches that run for " + nas_test::Me() + " to end\r\n");
  End(running[3]);
  said.clear();
  while (hear()) {
  }
  EXPECT_EQ(pclose(watched), 0);
  EXPECT_NE(said.find("plain/a.txt\r\n"), std::string::npos) << said;
  const Output output = Finish(unwatched);
  EXPECT_EQ(output.exit_code, 0) << output.err;
  EXPECT_EQ(Pieces(output.out, '\0').size(), 1U);
  EXPECT_EQ(output.err, "");
  for (const std::string& id : running) {
    if (id != running[3]) End(id);
  }
}

TEST_F(Scope, FoldersThatCannotBeReadAreNamed) {
  fs::create_directories(share_ + "/closed\n one");
  ASSERT_EQ(chmod((share_ + "/closed\n one").c_str(), 0), 0);
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    const Output output = Run({"search", "--show-errors", "", share_});
    EXPECT_NE(output.err.find("/closed\\x0A one: Permission denied\n"), std::string::npos)
        << output.err;
    EXPECT_EQ(Run({"search", "", share_}).err.find("Permission denied\n"), std::string::npos);
  }));
}

// Whatever their names, the search's outcome has a place beside them.
TEST_F(Scope, VeryManyFoldersThatCannotBeReadAreCounted) {
  constexpr int kFolders = 1'000;
  const std::string long_name(240, '\1');
  const std::string folder = share_ + "/" + long_name + "/" + long_name + "/" + long_name;
  fs::create_directories(folder);
  for (int number = 0; number < kFolders; ++number) {
    const std::string closed = folder + "/" + std::to_string(number) + long_name;
    ASSERT_EQ(mkdir(closed.c_str(), 0), 0);
  }
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    const Output output = Run({"search", "--show-errors", "nothing", share_});
    EXPECT_EQ(output.exit_code, Run({"search", "nothing", share_}).exit_code);
    EXPECT_NE(output.err.find(": Permission denied\n"), std::string::npos);
    EXPECT_NE(output.err.find("1,000 folders could not be read (perm"), std::string::npos);
  }));
}

TEST_F(Scope, TimesOfEveryCentury) {
  const struct {
    const char* name;
    std::int64_t time;
  } files[] = {{"early", -2'000'000'000},
               {"before", -86'400},
               {"now", 1'700'000'000},
               {"late", 4'000'000'000}};
  for (const auto& file : files) {
    WriteFile(share_ + "/" + file.name, "");
    const timespec times[2] = {{file.time, 0}, {file.time, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, (share_ + "/" + file.name).c_str(), times, 0), 0);
    struct stat status;
    stat((share_ + "/" + file.name).c_str(), &status);
    if (status.st_mtime != file.time) GTEST_SKIP() << "the file system does not keep such times";
  }
  const struct {
    std::vector<std::string> words;
    size_t found;
  } rows[] = {
      {{"modified:<1970 type:f"}, 2},  {{"type:f", "--mtime-to", "1969-12-31"}, 2},
      {{"modified:<1950 type:f"}, 1},  {{"modified:>=2050 type:f"}, 1},
      {{"modified:..2050 type:f"}, 3},
  };
  for (const auto& row : rows) {
    std::vector<std::string> words = {"search", "-0", row.words.front(), share_};
    words.insert(words.end(), row.words.begin() + 1, row.words.end());
    const Output output = Run(words);
    EXPECT_EQ(Pieces(output.out, '\0').size(), row.found)
        << row.words.front() << " " << row.words.back() << output.err;
  }
  EXPECT_NE(Run({"search", "-l", "early", share_}).out.find(" 1906-"), std::string::npos);
}

}  // namespace
}  // namespace program_test
