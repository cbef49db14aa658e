// arbory search over a fleet.

#include <algorithm>
#include <cstdio>
#include <iterator>
#include <sstream>

#include "tests/fleet/front.h"

namespace fleet_test {
namespace {

using nas_test::AmRoot;

class TerminalTest : public FrontTest {
 protected:
  // What the program prints for a search with these words, both streams, its lines sorted.
  std::vector<std::string> Run(const std::string& words) {
    const std::string config = dir_ + "/terminal.toml";
    nas_test::WriteFile(config, "state_dir = \"" + dir_ + "/terminal-state\"\nvolumes = []\n");
    const std::string as = AmRoot() ? "--user " + User() + " " : "";
    std::vector<std::string> lines =
        Lines("search --config " + config + " --fleet " + dir_ + "/fleet.toml " + as + words);
    std::ranges::sort(lines);
    return lines;
  }

  std::vector<std::string> Lines(const std::string& words) {
    const std::string command = ARBORY_BIN_DIR "/arbory " + words + " 2>&1";
    FILE* const out = popen(command.c_str(), "r");
    std::string text(size_t{64} << 10, '\0');
    text.resize(fread(text.data(), 1, text.size(), out));
    exit_ = WEXITSTATUS(pclose(out));
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
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
  EXPECT_EQ(Run("plan /box2"),
            (Lines{"arbory: box2: down (cannot be reached)", "arbory: no box answered"}));
  EXPECT_EQ(exit_, 2);
}

TEST_F(TerminalTest, StatusTellsOfEachBoxWhatItsIndexKnows) {
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2"), StartBox("box3")};
  for (int i = 0; i < 20; ++i) MakeFile(boxes[0], "folder/" + std::to_string(i));
  StartIndex(boxes[0]);
  StartFront(boxes);
  EXPECT_EQ(Stop(boxes[2].server), 0);
  // Each line's words.
  std::vector<std::vector<std::string>> table;
  for (const std::string& line : Lines("fleet status " + dir_ + "/fleet.toml")) {
    std::istringstream words(line);
    table.emplace_back(std::istream_iterator<std::string>(words),
                       std::istream_iterator<std::string>());
  }
  EXPECT_EQ(exit_, 1) << "one does not answer";
  ASSERT_EQ(table.size(), 4U);
  using Words = std::vector<std::string>;
  EXPECT_EQ(table[0], (Words{"BOX", "STATE", "VERSION", "NAMES", "INDEX", "CLOCK", "MS", "WHY"}));
  const auto begins = [&](size_t line, const Words& words) {
    Words is = table[line];
    is.erase(is.begin() + 2);  // the version
    is.resize(words.size());
    EXPECT_EQ(is, words);
  };
  // Names are counted, the folders among them; a user is told nothing of that.
  begins(1, AmRoot() ? Words{"box1", "answered", "21", "current", "0"}
                     : Words{"box1", "answered", "-", "-", "0"});
  begins(2, {"box2", "answered", "-"});
  EXPECT_EQ(table[3], (Words{"box3", "down", "-", "-", "-", "-", "-", "cannot", "be", "reached"}));
}

}  // namespace
}  // namespace fleet_test
