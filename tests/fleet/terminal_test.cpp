// arbory search over a fleet.

#include <algorithm>
#include <cstdio>
#include <sstream>

#include "tests/fleet/front.h"

namespace fleet_test {
namespace {

using nas_test::AmRoot;

class TerminalTest : public FrontTest {
 protected:
  // What the program prints for these words, both streams, its lines sorted.
  std::vector<std::string> Run(const std::string& words) {
    const std::string config = dir_ + "/terminal.toml";
    nas_test::WriteFile(config, "state_dir = \"" + dir_ + "/terminal-state\"\nvolumes = []\n");
    const std::string as = AmRoot() ? "--user " + User() + " " : "";
    const std::string command = ARBORY_BIN_DIR "/arbory search --config " + config + " --fleet " +
                                dir_ + "/fleet.toml " + as + words + " 2>&1";
    FILE* const out = popen(command.c_str(), "r");
    std::string text(size_t{64} << 10, '\0');
    text.resize(fread(text.data(), 1, text.size(), out));
    exit_ = WEXITSTATUS(pclose(out));
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    std::ranges::sort(lines);
    return lines;
  }

  int exit_ = 0;
};

TEST_F(TerminalTest, SearchesBoxesAndTheirShares) {
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2"), StartBox("box3")};
  for (const Box& box : boxes)
    MakeFile(box, "2026/plan of " + box.name + ".txt", AmRoot() ? kAnn : "", "12345");
  StartFront(boxes, "deadline_ms = 5000\n");
  using Lines = std::vector<std::string>;
  const std::string plan = "/data/2026/plan of box";
  EXPECT_EQ(Run("plan"),
            (Lines{"/box1" + plan + "1.txt", "/box2" + plan + "2.txt", "/box3" + plan + "3.txt"}));
  EXPECT_EQ(exit_, 0);
  EXPECT_EQ(Run("plan /box2 /box3/data/2026"),
            (Lines{"/box2" + plan + "2.txt", "/box3" + plan + "3.txt"}));
  const Lines one = Run("plan /box1/data -l");
  ASSERT_EQ(one.size(), 1U);
  EXPECT_NE(one[0].find(" " + std::string(AmRoot() ? kAnn : "")), std::string::npos) << one[0];
  EXPECT_EQ(Run("nothing"), Lines{});
  EXPECT_EQ(exit_, 1);
  EXPECT_EQ(Run("plan -x echo").size(), 1U) << "a command cannot open them";
  EXPECT_EQ(exit_, 2);
  EXPECT_EQ(Stop(boxes[1].server), 0);
  EXPECT_EQ(Run("plan"), (Lines{"/box1" + plan + "1.txt", "/box3" + plan + "3.txt",
                                "arbory: box2: down (cannot be reached)"}));
  EXPECT_EQ(exit_, 0);
  EXPECT_EQ(Run("plan /box2").size(), 2U) << "and that the search failed";
  EXPECT_EQ(exit_, 2);
}

}  // namespace
}  // namespace fleet_test
