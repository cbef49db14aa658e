// What a run of the terminal's search does beside the query: it waits for a place among its user's
// searches, tells what it could not read, and takes times of every century.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <thread>

#include "nas/system/config.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

namespace fs = std::filesystem;

class Scope : public ProgramTest {};

TEST_F(Scope, OneSearchTooManyWaitsForAPlace) {
  fs::create_directories(share_ + "/plain");
  fs::create_directories(share_ + "/endless");
  WriteFile(share_ + "/plain/a.txt", "");
  MakeEndlessFile(share_ + "/endless/file");
  std::vector<std::string> running;
  for (int i = 0; i < nas::CurrentConfig().searches_per_user; ++i) {
    running.push_back(Start(Json_(R"({"folder_path": "/share/endless", "pattern": "zzz",
                                      "search_content": true})")));
  }
  const pid_t program = Launch({"search", "-0", "a.txt", share_ + "/plain"});
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  EXPECT_EQ(kill(program, 0), 0) << "it waits";
  Json::Value one(Json::objectValue);
  one["taskid"] = running[3];
  Call("stop", one);
  const Output output = Finish(program);
  EXPECT_EQ(output.exit_code, 0) << output.err;
  EXPECT_EQ(Pieces(output.out, '\0').size(), 1U);
  EXPECT_EQ(output.err, "") << "nothing is said where nobody watches";
  for (const std::string& id : running) {
    one["taskid"] = id;
    Call("stop", one);
    Call("clean", one);
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
