// What the program says of a file that a search does not find: every rule once, as its user sees
// it.

#include <sys/mount.h>

#include "tests/program/program_test.h"

namespace program_test {
namespace {

using testing::HasSubstr;

class Why : public ProgramTest {
 protected:
  struct Row {
    std::vector<std::string> words;  // after "why"
    int exit_code;
    const char* says;
  };

  void SetUp() override {
    ProgramTest::SetUp();
    WriteFile(share_ + "/plan.txt", "the needle");
    WriteFile(share_ + "/binary.dat", std::string("needle\0", 7));
    MakeFolder("volume1/share/docs/deep");
    MakeFolder("volume1/@tmp");
    WriteFile(share_ + "/docs/deep/x", "x");
    WriteFile(share_ + "/odd\n\xff.txt", "");
    const timespec times[2] = {{1'000'000'000, 0}, {1'100'000'000, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, (share_ + "/plan.txt").c_str(), times, 0), 0);
    std::filesystem::create_directory_symlink("docs", share_ + "/link");
    std::filesystem::create_symlink("nowhere", share_ + "/dangling");
    WriteFile(dir_ + "/volume1/@tmp/x", "");
  }

  void Compare(const std::vector<Row>& rows) {
    for (const Row& row : rows) {
      std::vector<std::string> words = {"why"};
      words.insert(words.end(), row.words.begin(), row.words.end());
      SCOPED_TRACE(testing::PrintToString(words));
      const Output output = Run(words);
      EXPECT_EQ(output.exit_code, row.exit_code);
      const bool failed = row.exit_code == 2;
      EXPECT_THAT(failed ? output.err : output.out, HasSubstr(row.says));
      EXPECT_EQ(failed ? output.out : output.err, "");
    }
  }
};

TEST_F(Why, EachRule) {
  const std::string outside = dir_ + "/volume1/@tmp/x";
  Compare({
      {{"plan.txt", "plan"}, 0, "plan.txt matches\n"},
      {{"plan.txt", "plan", "--limit", "1"}, 0, "depends on --offset and --limit"},
      {{"plan.txt", "zz", "--sort", "size", "--desc", "-l"}, 1, "name that does not match"},
      {{"plan.txt", "", "-e", "pdf,jpg"}, 1, "none of the extensions"},
      {{"plan.txt", "", "-t", "image"}, 1, "not of the type"},
      {{"plan.txt", "", "--size-from", "11"}, 1, "is smaller than asked for (10 bytes)"},
      {{"plan.txt", "", "--size-to", "9"}, 1, "is larger than asked for (10 bytes)"},
      {{"docs", "", "--size-from", "0"}, 1, "it is a folder, and folders match no size"},
      {{"plan.txt", "", "--mtime-from", "1100000001"}, 1, "modified earlier than asked for (2004-"},
      {{"plan.txt", "", "--mtime-to", "1099999999"}, 1, "modified later than asked for (2004-"},
      {{"plan.txt", "", "--atime-from", "1000000001"}, 1, "read earlier than asked for (2001-"},
      {{"plan.txt", "", "--atime-to", "999999999"}, 1, "read later than asked for (2001-"},
      {{"plan.txt", "", "--crtime-from", "2037-01-01"}, 1, "created earlier than asked for (20"},
      {{"plan.txt", "", "--crtime-to", "2001-01-01"}, 1, "created later than asked for (20"},
      {{"plan.txt", "", "--owner", "daemon"}, 1, "not owned by the user asked for ("},
      {{"plan.txt", "", "--group", "daemon"}, 1, "not of the group asked for ("},
      {{"plan.txt", "needle"}, 1, "name that does not match"},
      {{"plan.txt", "needle", "--content"}, 0, "matches"},
      {{"plan.txt", "hay", "--content"}, 1, "neither by its name nor by its contents"},
      {{"binary.dat", "needle", "--content"}, 1, "is binary"},
      {{"docs", "needle", "--content"}, 1, "name that does not match"},
      {{"docs/deep/x", "", "docs", "--no-recursive"}, 1, "are not entered (--no-recursive)"},
      {{"docs/deep", "", "docs", "--no-recursive"}, 0, "matches"},
      {{outside, "", dir_ + "/volume1"}, 1, "/volume1/@tmp is the temporary folder of a volume"},
      {{"plan.txt", "", "docs"}, 1, "in none of the folders"},
      {{".", ""}, 1, "in none of the folders"},
  });
}

TEST_F(Why, EachWayToAFile) {
  Compare({
      {{"./docs//deep/x", ""}, 0, "matches"},
      {{share_ + "/docs/deep/x", "", "docs/deep", "docs"}, 0, "matches"},
      {{"docs/deep/../../plan.txt", ""}, 0, "matches"},
      {{"docs/deep/", ""}, 0, "matches"},
      {{"docs/deep/.", ""}, 0, "matches"},
      {{"link/deep/x", ""}, 1, "/share/link is a symbolic link"},
      {{"link/deep/x", "", "link"}, 0, "matches"},
      {{"docs/deep/x", "", "link"}, 0, "matches"},
      {{"link", ""}, 0, "matches"},
      {{"dangling", ""}, 0, "matches"},
      {{"odd\n\xff.txt", ""}, 0, "odd\n\xff.txt matches"},
      {{"[a", ""}, 2, "there is no '[a'"},
      {{"none", ""}, 2, "there is no 'none'"},
      {{"plan.txt/x", ""}, 2, "there is no 'plan.txt/x'"},
      {{"plan.txt", "", "none"}, 2, "cannot search 'none'"},
      {{"plan.txt", "regex:("}, 2, "'regex:(': missing closing parenthesis"},
      {{"plan.txt", "", "-t", "song"}, 2, "there are file, dir, link, executable"},
      {{"plan.txt"}, 2, "PATTERN is required"},
  });
}

TEST_F(Why, SearchThatFindsNothing) {
  const struct {
    std::vector<std::string> words;  // after "search"
    const char* says;
  } rows[] = {
      {{"zz"}, "nothing found among 8 names in 3 folders\n"},
      {{"name:plan"}, "did you mean 'plan'?\n"},
      {{"plam"}, "near to 'plam': plan.txt\n"},
      {{"Pl\u00e0n|zz"}, "near to 'Pl\u00e0n|zz': plan.txt\n"},
      {{"plan size:>1kb"}, "without 'size:>1kb' there would be 1 file\n"},
      {{"<ext:pdf | ext:doc >|zz plan"},
       "without '<ext:pdf | ext:doc >|zz' there would be 1 file\n"},
      {{"plan", "--size-from", "1k"}, "without one of the options there would be 1 file\n"},
      {{"plan content:hay"}, "without 'content:hay' there would be 1 file\n"},
      {{"zz", dir_ + "/volume1"},
       "1 folder of the system's own or of its temporary files is never"},
  };
  for (const auto& row : rows) {
    std::vector<std::string> words = {"search"};
    words.insert(words.end(), row.words.begin(), row.words.end());
    const Output output = Run(words);
    EXPECT_EQ(output.exit_code, 1);
    EXPECT_EQ(output.out, "");
    EXPECT_THAT(output.err, HasSubstr(row.says));
  }
  EXPECT_THAT(Run({"search", "plan", "--offset", "1"}).err, "");
}

TEST_F(Why, WhatAnOrdinaryUserMayNotRead) {
  ASSERT_EQ(chmod((share_ + "/docs").c_str(), 0711), 0);
  MakeFolder("volume1/share/listed");
  WriteFile(share_ + "/listed/x", "");
  ASSERT_EQ(chmod((share_ + "/listed").c_str(), 0744), 0);
  ASSERT_EQ(chmod((share_ + "/plan.txt").c_str(), 0), 0);
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    Compare({
        {{"docs/deep/x", ""}, 1, "/share/docs cannot be read (Permission denied)"},
        {{"docs/deep/x", "", "docs"}, 1, "a folder cannot be searched: /share/docs: Permission"},
        {{"docs/deep/x", "", "docs/deep"}, 0, "matches"},
        {{"listed/x", ""}, 1, "it cannot be looked at (Permission denied)"},
        {{"plan.txt", "plan"}, 0, "matches"},
        {{"plan.txt", "needle", "--content"}, 1, "contents cannot be read (Permission denied)"},
    });
  }));
}

TEST_F(Why, MountsAndLocationsBySeveralWays) {
  MakeFolder("volume1/share/proc");
  MakeFolder("volume1/share/bound");
  if (mount("proc", (share_ + "/proc").c_str(), "proc", 0, nullptr) != 0) {
    GTEST_SKIP() << "mounting needs root";
  }
  const std::string other = MakeFolder("other");
  WriteFile(other + "/x", "");
  ASSERT_EQ(mount(other.c_str(), (share_ + "/bound").c_str(), "", MS_BIND, nullptr), 0);
  Compare({
      {{"proc/self", ""}, 1, "/share/proc is on a file system of the system's own"},
      {{"proc/version", "", "proc"}, 0, "matches"},
      {{"bound/x", ""}, 0, "matches"},
      {{"bound/x", "", ".", other}, 1, "/share/bound is one of the folders to search"},
      {{other + "/x", "", ".", other}, 0, "matches"},
  });
  umount((share_ + "/proc").c_str());
  umount((share_ + "/bound").c_str());
}

}  // namespace
}  // namespace program_test
