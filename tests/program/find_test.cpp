// `arbory find` by an index daemon of the test's own: what is printed, what is refused, and what a
// search leaves out where the index has answered.

#include <gtest/gtest.h>

#include <cstdlib>

#include "arbory/picker.h"
#include "arbory/rows.h"
#include "nas/search/index_question.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

using testing::HasSubstr;
using testing::Not;

class Find : public ProgramTest {
 protected:
  void TearDown() override {
    if (daemon_ > 0) {
      kill(daemon_, SIGTERM);
      Finish(daemon_);
    }
    ProgramTest::TearDown();
  }

  void StartDaemon() {
    daemon_ = Launch({"index"});
    Output status;
    EXPECT_TRUE(Eventually([&] {
      status = Run({"index", "--status"});
      return status.exit_code == 0 || status.out.find("not indexed") != std::string::npos;
    })) << status.out
        << status.err;
    indexed_ = status.exit_code == 0;
  }

  // Asked again where the daemon had no time to answer: the machine may do much else.
  Output Ask(const std::vector<std::string>& arguments) {
    Output output;
    EXPECT_TRUE(Eventually([&] {
      output = Run(arguments);
      return output.err.find("busy") == std::string::npos;
    }));
    return output;
  }

  pid_t daemon_ = -1;
  bool indexed_ = false;
};

#define SKIP_UNLESS_INDEXED() \
  if (!indexed_) GTEST_SKIP() << "needs a file system that tells of all changes"

TEST_F(Find, PrintsTheBestOrSaysWhyNot) {
  MakeFolder("volume1/share/below");
  MakeFolder("volume1/alone");
  const std::string other = MakeFolder("volume1/other");
  const std::string odd = share_ + "/odd\n\xff{q}'";
  for (const std::string& path : {share_ + "/floorplan", share_ + "/below/plan b", share_ + "/plan",
                                  other + "/[plan", odd, dir_ + "/volume1/alone/one"}) {
    WriteFile(path, "");
  }
  const Output none = Run({"find", "plan"});
  EXPECT_EQ(none.exit_code, 2);
  EXPECT_THAT(none.err, HasSubstr("no index")) << none.err;
  EXPECT_THAT(none.err, HasSubstr("arbory search"));
  StartDaemon();
  SKIP_UNLESS_INDEXED();
  const std::string most = std::to_string(nas::kMostBest);
  const std::string both = share_ + "/plan\n" + share_ + "/below/plan b\n";
  const struct {
    const char* why;
    std::vector<std::string> arguments;
    int exit_code;
    std::string out;
    const char* err;  // a part; nothing else is said
  } rows[] = {
      {"by default everywhere; the best first",
       {"plan", "!["},
       0,
       both + share_ + "/floorplan\n",
       ""},
      {"words together", {"plan", "floor"}, 0, share_ + "/floorplan\n", ""},
      {"a folder", {"plan", "--in", "below"}, 0, share_ + "/below/plan b\n", ""},
      {"folders, one of them twice",
       {"--in", ".", "--in", other, "--in", "below", "plan", "!floor"},
       0,
       both + other + "/[plan\n",
       ""},
      {"what begins with a bracket", {"[plan"}, 0, other + "/[plan\n", ""},
      {"criteria alone", {"-t", "dir", "--in", "."}, 0, share_ + "/below/\n", ""},
      {"the folder alone",
       {"--no-recursive", "plan", "--in", "."},
       0,
       share_ + "/plan\n" + share_ + "/floorplan\n",
       ""},
      {"fewer than there are",
       {"plan", "![", "--limit", "2"},
       0,
       both,
       "arbory: more than 2 match; arbory search lists all\n"},
      {"exactly as many", {"plan b", "--limit", "1"}, 0, share_ + "/below/plan b\n", ""},
      {"any bytes", {"odd", "-0"}, 0, odd + '\0', ""},
      {"nothing", {"nowhere"}, 1, "", ""},
      {"contents", {"content:plan"}, 2, "", "find does not look into contents"},
      {"contents too", {"plan", "--content"}, 2, "", "find does not look into contents"},
      {"a wrong expression", {"regex:("}, 2, "", "missing closing parenthesis"},
      {"more than are answered",
       {"plan", "--limit", std::to_string(nas::kMostBest + 1)},
       2,
       "",
       "arbory search lists all"},
      {"as many as are answered",
       {"one", "-t", "file", "--limit", most},
       0,
       dir_ + "/volume1/alone/one\n",
       ""},
      {"none", {"plan", "--limit", "0"}, 2, "", "is no number from 1"},
      {"no folder", {"plan", "--in", "nowhere"}, 2, "", "cannot search 'nowhere'"},
      {"what is not indexed", {"plan", "--in", "/proc"}, 2, "", "arbory search does without it"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    std::vector<std::string> arguments = {"find"};
    arguments.insert(arguments.end(), row.arguments.begin(), row.arguments.end());
    const Output output = Ask(arguments);
    EXPECT_EQ(output.exit_code, row.exit_code);
    EXPECT_EQ(output.out, row.out);
    EXPECT_THAT(output.err, HasSubstr(row.err));
    EXPECT_EQ(output.err.empty(), *row.err == '\0') << output.err;
  }
  // The same row as a search's, though the volume was asked and not the share.
  EXPECT_EQ(Ask({"find", "floorplan", "--json"}).out,
            Run({"search", "floorplan", share_, "--json"}).out);
  const std::vector<std::string> choices = Pieces(Ask({"find", "odd", "--choices"}).out, '\0');
  ASSERT_EQ(choices.size(), 1u);
  EXPECT_EQ(arbory::PathOfChoice(choices[0]), odd);
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); })) << "nothing is stored";
}

TEST_F(Find, ShowsAUserWhatTheyMaySee) {
  SKIP_UNLESS_ROOT();
  ASSERT_EQ(chmod(dir_.c_str(), 0755), 0);
  WriteFile(share_ + "/open-plan", "");
  WriteFile(MakeFolder("volume1/share/closed", 0700) + "/plan", "");
  WriteFile(MakeFolder("volume1/shut", 0700) + "/plan", "");
  StartDaemon();
  SKIP_UNLESS_INDEXED();
  const Output output = Ask({"find", "plan", "--user", nas_test::kOtherUser});
  EXPECT_EQ(output.out, share_ + "/open-plan\n");
  EXPECT_EQ(output.err, "");
}

TEST_F(Find, ASearchThatTheIndexAnsweredWalksForNoAdvice) {
  WriteFile(share_ + "/plan", "");
  StartDaemon();
  SKIP_UNLESS_INDEXED();
  EXPECT_EQ(Run({"search", "plain"}).err, "");
  EXPECT_THAT(Run({"search", "plain", "--index", "never"}).err, HasSubstr("nothing found among"));
}

// fzf replaces what stands in braces, then a shell reads the command.
TEST(Picker, ItsCommandHoldsTheWordsAsTheyAre) {
  const std::vector<std::string> words = {"--in",      "a b",      "it's", "{q}",   "{}",
                                          "$(exit 3)", "`exit 3`", "a\nb", "\\{q}", ""};
  std::string command = arbory::ChoicesCommand("printf", words);
  ASSERT_THAT(command, testing::EndsWith(" {q}"));
  command.resize(command.size() - std::string("{q}").size());
  for (const char* placeholder : {"{q}", "{}"}) {
    EXPECT_THAT(command, Not(HasSubstr(placeholder)));
  }
  command.insert(std::string("'printf'").size(), " '%s|'");
  FILE* shell = popen(command.c_str(), "r");
  ASSERT_NE(shell, nullptr);
  std::string out(4096, '\0');
  out.resize(fread(out.data(), 1, out.size(), shell));
  EXPECT_EQ(pclose(shell), 0);
  std::string expected;
  for (const std::string& word : words) expected += word + "|";
  EXPECT_EQ(out, expected + "--choices|--|");
}

}  // namespace
}  // namespace program_test
