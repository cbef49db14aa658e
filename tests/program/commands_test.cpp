// What is run for what is found.

#include <cstdlib>

#include "arbory/path_template.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

TEST(PathTemplates, HavePlacesForPartsOfAPath) {
  const char* const all = "{} {/} {//} {.} {/.}";
  const struct {
    const char* text;
    const char* path;
    const char* made;
  } rows[] = {
      {all, "a/b.tar.gz", "a/b.tar.gz b.tar.gz a a/b.tar b.tar"},
      {all, "./b.c", "./b.c b.c . b b"},
      {all, "b", "b b . b b"},
      {all, "/b.c", "/b.c b.c / /b b"},
      {all, "a.d/b", "a.d/b b a.d a.d/b b"},
      {all, "a/.rc", "a/.rc .rc a a/.rc .rc"},
      {"-{}-{}", "x", "-x-x"},
      {"{{}} {/} {x} {", "{}", "{} {} {x} {"},
      {"", "x", ""},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(arbory::PathTemplate(row.text).Of(row.path), row.made) << row.text << " " << row.path;
  }
}

class Commands : public ProgramTest {
 protected:
  void SetUp() override {
    ProgramTest::SetUp();
    for (const char* name : {"a b.txt", "it's.txt", "$(x).txt", "new\nline.txt"}) {
      WriteFile(share_ + "/" + name, "");
    }
    WriteFile(MakeFolder("volume1/share/sub") + "/-c.txt", "");
  }
  // The lines of the output, sorted: commands run in any order.
  std::vector<std::string> Lines(const Output& output) {
    std::vector<std::string> lines = Pieces(output.out, '\n');
    std::ranges::sort(lines);
    return lines;
  }
};

TEST_F(Commands, RunForEachPathOrForAll) {
  const struct {
    const char* why;
    std::vector<std::string> arguments;
    std::vector<std::string> lines;
    int exit_code;
  } rows[] = {
      {"a path is one word, and no option",
       {"-c.txt", "-x", "printf", "<%s>\n"},
       {"<./sub/-c.txt>"},
       0},
      {"no shell looks at it", {"x)", "-x", "echo"}, {"./$(x).txt"}, 0},
      {"places", {"a b", "-x", "echo", "{/.}", "{//}{}"}, {"a b ../a b.txt"}, 0},
      {"as the folder was named", {"c.txt", "sub", "-x", "echo"}, {"sub/-c.txt"}, 0},
      {"options behind the command",
       {"txt", "-x", "printf", "%s\n", "{/}", ";", "-e", "txt", "--limit", "9", "sub"},
       {"-c.txt"},
       0},
      {"one at a time, in order, with this program's output",
       {"ext:txt !n", "-j", "1", "-x", "echo", "{/}"},
       {"$(x).txt", "-c.txt", "a b.txt", "it's.txt"},
       0},
      {"one of them fails", {"txt", "-x", "test", "{/}", "=", "a b.txt"}, {}, 1},
      {"nothing is found", {"nowhere", "-x", "echo"}, {}, 1},
      {"all at once",
       {"ext:txt !n", "-X", "echo", "{/}", "end"},
       {"$(x).txt -c.txt a b.txt it's.txt end"},
       0},
      {"all at once, failing", {"txt", "-X", "false"}, {}, 1},
      {"nothing to run for", {"nowhere", "-X", "echo", "ran"}, {}, 1},
      {"no such program", {"txt", "-x", "no-such-program"}, {}, 1},
      {"without words", {"txt", "-x"}, {}, 2},
      {"two places for all", {"txt", "-X", "echo", "{}", "{}"}, {}, 2},
      {"two ways", {"txt", "--json", "-x", "echo"}, {}, 2},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    std::vector<std::string> words = {"search", "--sort", "name"};
    const bool option = row.arguments[0].starts_with('-');
    words.insert(words.end(), row.arguments.begin() + (option ? 1 : 0), row.arguments.end());
    if (option) words.insert(words.begin() + 3, "c.txt");
    const Output output = Run(words);
    EXPECT_EQ(output.exit_code, row.exit_code) << output.err;
    EXPECT_EQ(Lines(output), row.lines) << output.err;
  }
}

// What one command writes is not mixed with what another writes.
TEST_F(Commands, OutputOfEachStaysTogether) {
  for (int i = 0; i < 20; ++i) WriteFile(share_ + "/n" + std::to_string(i), "");
  const Output output = Run({"search", "regex:^n[0-9]", "-x", "sh", "-c",
                             "echo $0 1; sleep 0.0$((${#0} % 3)); echo $0 2; echo $0 3 >&2"});
  const auto lines = Pieces(output.out, '\n');
  ASSERT_EQ(lines.size(), 40U);
  for (size_t i = 0; i < lines.size(); i += 2) {
    EXPECT_EQ(lines[i].substr(0, lines[i].size() - 1),
              lines[i + 1].substr(0, lines[i + 1].size() - 1));
  }
  EXPECT_EQ(Pieces(output.err, '\n').size(), 20U);
}

// More paths than one command can take are given to several.
TEST_F(Commands, BatchesFitTheSystem) {
  const std::string folder = MakeFolder("volume1/share/many");
  const std::string name(240, 'n');
  constexpr int kFiles = 2'000;
  for (int i = 0; i < kFiles; ++i) WriteFile(folder + "/" + name + std::to_string(i), "");
  const std::string command = "cd " + share_ + " && ulimit -s 512 && ARBORY_CONFIG=" + dir_ +
                              "/as-" + nas_test::Me() + "/arbory.toml " + program_ +
                              " search nnnn -X sh -c 'echo $#' > " + dir_ + "/counts";
  ASSERT_EQ(system(command.c_str()), 0);
  int paths = 0;
  const auto counts = Pieces(nas_test::ReadFile(dir_ + "/counts"), '\n');
  for (const std::string& count : counts) paths += std::stoi(count) + 1;  // and $0
  EXPECT_EQ(paths, kFiles);
  EXPECT_GT(counts.size(), 1U);
}

TEST_F(Commands, AreEndedByAnInterrupt) {
  const auto runs = [] { return system("pgrep -f '^sleep 61.25$' >/dev/null") == 0; };
  const pid_t program = Launch({"search", "a b", "-x", "sh", "-c", "exec sleep 61.25"});
  EXPECT_TRUE(Eventually(runs));
  kill(program, SIGINT);
  EXPECT_EQ(Finish(program).exit_code, 130);
  EXPECT_FALSE(runs());
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
}

TEST_F(Commands, CountsAndAnswersWithoutPaths) {
  const Output count = Run({"search", "txt", "-c"});
  EXPECT_EQ(count.out, "5\n");
  EXPECT_EQ(Run({"search", "nowhere", "-c"}).out, "0\n");
  MakeEndlessFile(share_ + "/endless.log");
  // Does not wait for the end of the search, which is hours away.
  const Output quiet = Run({"search", "txt", "-q", "--content"});
  EXPECT_EQ(quiet.exit_code, 0);
  EXPECT_EQ(quiet.out + quiet.err, "");
  const Output none = Run({"search", "nowhere", "--quiet"});
  EXPECT_EQ(none.exit_code, 1);
  EXPECT_EQ(none.out + none.err, "");
  EXPECT_EQ(Pieces(Run({"search", "txt", "-1"}).out, '\n').size(), 1U);
  EXPECT_EQ(Run({"search", "a b", "--format", "<{/.}>"}).out, "<a b>\n");
}

// Each library is loaded at every start and copied with every fork: what few processes need lies in
// libraries of its own.
TEST_F(Commands, StartWithFewLibraries) {
  setenv("LD_TRACE_LOADED_OBJECTS", "1", 1);
  const std::string loaded = Run({"search", "txt"}).out;
  unsetenv("LD_TRACE_LOADED_OBJECTS");
  EXPECT_THAT(loaded, HasSubstr("libarbory_nas.so"));
  for (const char* other : {"libarchive", "libpam", "libcurl", "libsodium", "libxml2", "libssl"}) {
    EXPECT_THAT(loaded, Not(HasSubstr(other)));
  }
}

}  // namespace
}  // namespace program_test
