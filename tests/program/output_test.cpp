// What a person or a script gets to see, and the values they may write.

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>
#include <map>

#include "arbory/locate.h"
#include "arbory/options.h"
#include "arbory/parse.h"
#include "arbory/terminal.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

TEST(Values, Sizes) {
  const std::pair<const char*, std::int64_t> rows[] = {{"0", 0},
                                                       {"10", 10},
                                                       {"10k", 10240},
                                                       {"5M", 5 << 20},
                                                       {"1GiB", 1 << 30},
                                                       {"1.5G", 3 << 29},
                                                       {"2TB", std::int64_t{2} << 40},
                                                       {"8191P", std::int64_t{8191} << 50},
                                                       {"9223372036854775807", INT64_MAX}};
  for (const auto& [text, bytes] : rows) EXPECT_EQ(arbory::ParseSize(text), bytes) << text;
  for (const char* none : {"8192P", "9223372036854775808", "", "-1", "k", "0x10"}) {
    EXPECT_THROW(arbory::ParseSize(none), arbory::UsageError) << none;
  }
}

TEST(Values, Times) {
  setenv("TZ", "Europe/Berlin", 1);
  tzset();
  constexpr std::time_t kNow = 1'800'000'000;
  const auto seconds = [](const char* text, arbory::Bound bound) {
    return arbory::ParseTime(text, bound, kNow);
  };
  const std::tuple<const char*, std::int64_t, std::int64_t> days[] = {
      {"2026-01-31", 1'769'814'000, 1'769'900'399},
      {"2026-03-29", 1'774'738'800, 1'774'821'599},  // 23 hours: summer time begins
      {"2024-02-29", 1'709'161'200, 1'709'247'599},
      {"yesterday", 1'799'881'200, 1'799'967'599},
  };
  for (const auto& [text, from, to] : days) {
    EXPECT_EQ(seconds(text, arbory::Bound::kFrom), from) << text;
    EXPECT_EQ(seconds(text, arbory::Bound::kTo), to) << text;
  }
  const std::pair<const char*, std::int64_t> moments[] = {{"0", 0},
                                                          {"1700000000", 1'700'000'000},
                                                          {"2147483647", INT32_MAX},
                                                          {"2026-01-31T12:00", 1'769'857'200},
                                                          {"2026-01-31T12:00:07", 1'769'857'207},
                                                          {"30m", kNow - 1800},
                                                          {"12h", kNow - 43'200},
                                                          {"7d", kNow - 604'800},
                                                          {"2w", kNow - 1'209'600}};
  for (const auto& [text, moment] : moments) {
    EXPECT_EQ(seconds(text, arbory::Bound::kFrom), moment) << text;
    EXPECT_EQ(seconds(text, arbory::Bound::kTo), moment) << text;
  }
  for (const char* none :
       {"2147483648", "2026-02-29", "2026-13-01", "2026-1-1", "2026-01-31T25:00", "2026-01-31x",
        "2039-01-01", "1900-01-01", "7x", "99999999999999999d", ""}) {
    EXPECT_THROW(seconds(none, arbory::Bound::kFrom), arbory::UsageError) << none;
  }
}

TEST(Values, SharesOfTheirOwnHaveAllowedNames) {
  const std::vector<std::string> taken = {"photo", "photo-2"};
  const std::pair<const char*, std::string> rows[] = {
      {"", "root"},        {"/srv/music", "music"}, {"/srv/photo", "photo-3"},
      {"/home", "home-2"}, {"/a/Homes", "Homes-2"}, {"/a/b,c\n", "b_c_"},
      {"/a/.hid", ".hid"},
  };
  for (const auto& [folder, name] : rows) EXPECT_EQ(arbory::FreeShareName(folder, taken), name);
}

TEST(Values, NamesOnATerminal) {
  const std::pair<std::string, std::string> rows[] = {
      {"plain caf\u00e9 \u65e5\u672c", "plain caf\u00e9 \u65e5\u672c"},
      {"red\x1b[31m\n\r\t\x7f", "red\\x1B[31m\\x0A\\x0D\\x09\\x7F"},
      {"bad\xff\xc3", "bad\\xFF\\xC3"},
      {"csi\u009b1m", "csi\\xC2\\x9B1m"},
      {"exe\u202etxt.", "exe\\xE2\\x80\\xAEtxt."},
      {"nbsp\u00a0", "nbsp\u00a0"},
  };
  for (const auto& [name, shown] : rows) EXPECT_EQ(arbory::Escaped(name), shown);
}

class PrintedRows : public ProgramTest {
 protected:
  void SetUp() override {
    ProgramTest::SetUp();
    const std::pair<const char*, size_t> files[] = {
        {"IMG2.jpg", 300}, {"img10.jpg", 100}, {"IMG1.jpg", 200}, {"bro\xffken\n.jpg", 0}};
    for (const auto& [name, size] : files) WriteFile(share_ + "/" + name, std::string(size, 'x'));
  }
  std::vector<std::string> Names(std::vector<std::string> words) {
    words.insert(words.begin(), {"search", "-0", "jpg"});
    std::vector<std::string> names;
    for (const std::string& path : Pieces(Run(words).out, '\0')) {
      names.push_back(path.substr(std::string("./").size()));
    }
    return names;
  }
};

TEST_F(PrintedRows, PathsBeginAsTheFolderWasNamed) {
  WriteFile(MakeFolder("volume1/share/plan/below") + "/plan", "");
  ASSERT_EQ(symlink("plan", (share_ + "/link").c_str()), 0);
  const std::string real = share_ + "/plan/below/plan";
  const struct {
    const char* why;
    std::vector<std::string> arguments;
    std::string out;
  } rows[] = {
      {"nothing named; a folder ends with a slash", {}, "plan/\nplan/below/plan\n"},
      {"for another program no name begins an option",
       {"-0"},
       std::string("./plan/\0./plan/below/plan\0", 26)},
      {"the current folder", {"."}, "./plan/\n./plan/below/plan\n"},
      {"slashes at the end", {"plan//"}, "plan/below/plan\n"},
      {"upwards", {"../share/plan"}, "../share/plan/below/plan\n"},
      {"through a link", {"link"}, "link/below/plan\n"},
      {"absolute", {share_ + "/link"}, share_ + "/link/below/plan\n"},
      {"one inside another", {"plan/below", "./plan"}, "plan/below/plan\n"},
      {"as on disk", {"-a", "link"}, real + "\n"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    std::vector<std::string> words = {"search", "plan", "--sort", "path"};
    words.insert(words.end(), row.arguments.begin(), row.arguments.end());
    EXPECT_EQ(Run(words).out, row.out);
  }
}

TEST_F(PrintedRows, SortedPages) {
  EXPECT_THAT(Names({"--sort", "size", "--desc"}),
              ElementsAre("IMG2.jpg", "IMG1.jpg", "img10.jpg", "bro\xffken\n.jpg"));
  EXPECT_THAT(Names({"--sort", "name", "--offset", "2"}), ElementsAre("IMG2.jpg", "img10.jpg"));
  EXPECT_THAT(Names({"--sort", "name", "--offset", "1", "--limit", "1"}), ElementsAre("IMG1.jpg"));
  EXPECT_EQ(Names({"--limit", "3"}).size(), 3U);
  EXPECT_EQ(Names({"--offset", "3"}).size(), 1U);
  EXPECT_EQ(Run({"search", "jpg", "--offset", "4"}).exit_code, 1);
}

TEST_F(PrintedRows, JsonIsOneValidObjectALine) {
  const Output output = Run({"search", "jpg", "--json", "--sort", "name"});
  const auto lines = Pieces(output.out, '\n');
  ASSERT_EQ(lines.size(), 4U);
  const Json::Value broken = Json_(lines[0]);
  EXPECT_EQ(broken["name"], "bro\uFFFDken\n.jpg");
  EXPECT_EQ(broken["path"], "bro\uFFFDken\n.jpg");
  EXPECT_EQ(broken["path_base64"], "YnJv/2tlbgouanBn");
  const Json::Value file = Json_(lines[3]);
  EXPECT_EQ(file["path"], "img10.jpg");
  EXPECT_EQ(file["real_path"], share_ + "/img10.jpg");
  EXPECT_FALSE(file.isMember("real_path_base64"));
  EXPECT_EQ(file["size"], 100);
  EXPECT_EQ(file["owner"]["user"], nas_test::Me());
  EXPECT_EQ(file["perm"]["mode"], "0644");
}

// What files are, and times that no clock showed.
TEST_F(PrintedRows, TypesAndTimesAsTheyAre) {
  const std::string odd = MakeFolder("volume1/share/odd");
  ASSERT_EQ(mkfifo((odd + "/pipe").c_str(), 0600), 0);
  ASSERT_EQ(symlink("nowhere", (odd + "/link").c_str()), 0);
  sockaddr_un address = {.sun_family = AF_UNIX, .sun_path = "socket"};
  const nas::UniqueFd folder(open(odd.c_str(), O_PATH | O_CLOEXEC));
  snprintf(address.sun_path, sizeof address.sun_path, "/proc/self/fd/%d/socket", folder.get());
  const nas::UniqueFd listener(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  WriteFile(odd + "/old", "");
  constexpr long kLongAgo = -300'000'000;  // 1960
  const timespec times[] = {{kLongAgo, 0}, {kLongAgo, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, (odd + "/old").c_str(), times, 0), 0);
  ASSERT_EQ(chmod((odd + "/old").c_str(), 06711), 0);
  std::map<std::string, Json::Value> rows;
  for (const std::string& line : Pieces(Run({"search", "--json", "", "odd"}).out, '\n')) {
    const Json::Value row = Json_(line);
    rows[row["name"].asString()] = row;
  }
  for (const char* type : {"pipe", "link", "socket"}) EXPECT_EQ(rows[type]["type"], type);
  EXPECT_EQ(rows["old"]["type"], "file");
  EXPECT_EQ(rows["old"]["time"]["mtime"].asInt64(), kLongAgo);
  const std::string table = "\n" + Run({"search", "-l", "", "odd"}).out;
  EXPECT_THAT(table, HasSubstr("-rws--s--x "));
  EXPECT_THAT(table, HasSubstr(" 1960-06-"));
  EXPECT_THAT(table, HasSubstr(" odd/link -> nowhere\n"));
  EXPECT_THAT(table, HasSubstr("\np"));
  EXPECT_THAT(table, HasSubstr("\ns"));
}

TEST_F(PrintedRows, Colours) {
  MakeFolder("volume1/share/in/deep");
  for (const char* name : {"in/a.TXT", "in/run", "in/b.md", "in/c.md~"}) {
    WriteFile(share_ + "/" + name, "");
  }
  ASSERT_EQ(chmod((share_ + "/in/run").c_str(), 0755), 0);
  ASSERT_EQ(symlink("nowhere", (share_ + "/in/lost").c_str()), 0);
  ASSERT_EQ(symlink("run", (share_ + "/in/to").c_str()), 0);
  // The escapes are shown as braces. A code that is none is not taken.
  setenv("LS_COLORS", "di=34:*.txt=33:*.md=36:*~=0:or=31:ln=target:fi=\033[2J", 1);
  std::string out = Run({"search", "", "in", "--sort", "name", "--color", "always"}).out;
  const std::string none = Run({"search", "", "in", "--sort", "name"}).out;
  unsetenv("LS_COLORS");
  for (size_t at; (at = out.find("\033[")) != std::string::npos;) {
    const bool end = out.compare(at, 4, "\033[0m") == 0;
    const size_t m = out.find('m', at);
    out.replace(at, m + 1 - at, end ? "}" : "{" + out.substr(at + 2, m - at - 2) + " ");
  }
  EXPECT_EQ(out,
            "{34 in/}{33 a.TXT}\n{34 in/}{36 b.md}\n{34 in/}c.md~\n{34 in/}{34 deep/}\n"
            "{34 in/}{31 lost}\n{34 in/}{01;32 run}\n{34 in/}{01;32 to}\n");
  EXPECT_THAT(none, testing::Not(HasSubstr("\033")));
}

TEST_F(PrintedRows, LinesOfContents) {
  WriteFile(share_ + "/old.txt", "one\ntwo caf\xe9\xc9\n\nthree CAF\xe9");
  WriteFile(share_ + "/caf\u00e9.bin", std::string(3, '\0'));
  WriteFile(share_ + "/other.bin", std::string(3, '\0'));
  const Output output = Run({"search", "-n", "caf\u00e9", "--sort", "name"});
  EXPECT_EQ(output.out,
            "caf\u00e9.bin\nold.txt:2:two caf\u00e9\u00c9\nold.txt:4:three CAF\u00e9\n");
  EXPECT_EQ(output.err, "arbory: 1 file is not text\n");
  const Json::Value row = Json_(Run({"search", "-A1", "one", "--json"}).out);
  EXPECT_EQ(row["lines"], Json_(R"([{"number": 1, "text": "one"},
                      {"number": 2, "text": "two caf\uFFFD\uFFFD", "context": true}])"));
  // What is asked of names alone is no part of the lines.
  EXPECT_EQ(Run({"search", "-n", "content:one old"}).out, "old.txt:1:one\n");
  const std::string coloured =
      Run({"search", "-n", "one", "--color", "always", "--index", "never"}).out;
  EXPECT_EQ(coloured,
            "\033[35mold.txt\033[0m\033[36m:\033[0m\033[32m1\033[0m\033[36m:\033[0m"
            "\033[01;31mone\033[0m\n");
}

TEST_F(PrintedRows, LongRowsTellModeOwnerSizeAndTime) {
  ASSERT_EQ(chmod((share_ + "/IMG2.jpg").c_str(), 0640), 0);
  const Output output = Run({"search", "img2", "-l"});
  EXPECT_THAT(output.out,
              testing::MatchesRegex("-rw-r----- [^ ]+ +[^ ]+ +300 [0-9-]+ [0-9:]+ IMG2.jpg\n"));
  EXPECT_THAT(Run({"search", "share", dir_ + "/volume1", "-l"}).out, testing::StartsWith("drwx"));
}

// A reader that goes away (head) ends the search quietly; a full disk is an error.
TEST_F(PrintedRows, OutputThatNobodyTakes) {
  for (int number = 0; number < 3000; ++number) {
    WriteFile(share_ + "/a long name that fills the pipe " + std::to_string(number) + ".jpg", "");
  }
  const std::string config = "ARBORY_CONFIG=" + dir_ + "/as-" + nas_test::Me() + "/arbory.toml ";
  const auto shell = [&](const std::string& command) {
    return WEXITSTATUS(system(("bash -c '" + command + "'").c_str()));
  };
  EXPECT_EQ(shell(config + program_ + " search jpg " + share_ +
                  " | head -n 1 >/dev/null; exit ${PIPESTATUS[0]}"),
            0);
  EXPECT_EQ(shell(config + program_ + " search jpg " + share_ + " >/dev/full 2>/dev/null"), 2);
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
}

TEST_F(PrintedRows, CallPrintsTheReply) {
  const Output output =
      Run({"call", "NUVA.Arbory.Search.History", "1", "set", "{\"pattern\": \"\xff\"}"});
  EXPECT_EQ(output.out, "{\"code\":0,\"data\":null}\n");
  EXPECT_EQ(output.exit_code, 0);
  const Output history = Run({"call", "NUVA.Arbory.Search.History", "1", "GET"});
  EXPECT_THAT(history.out, HasSubstr("\"pattern\":\"\uFFFD\""));
  const Output refused = Run({"call", "NUVA.Arbory.Search", "2", "list"});
  EXPECT_EQ(refused.out, "{\"code\":400,\"data\":null}\n");
  EXPECT_EQ(refused.exit_code, 1);
}

// On a terminal names are escaped and a long search shows how far it is.
TEST_F(PrintedRows, Terminal) {
  MakeEndlessFile(share_ + "/endless.log");
  const int terminal = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
  ASSERT_TRUE(terminal >= 0 && grantpt(terminal) == 0 && unlockpt(terminal) == 0);
  const std::string name = ptsname(terminal);
  const std::string config = dir_ + "/as-" + nas_test::Me() + "/arbory.toml";
  const pid_t program = fork();
  if (program == 0) {
    const int side = open(name.c_str(), O_RDWR | O_NOCTTY);
    dup2(side, STDOUT_FILENO);
    dup2(side, STDERR_FILENO);
    setenv("ARBORY_CONFIG", config.c_str(), 1);
    setenv("TERM", "xterm", 1);
    execl(program_.c_str(), "arbory", "search", "jpg", share_.c_str(), "--content", nullptr);
    _exit(127);
  }
  std::string seen;
  const auto has = [&](const char* text) { return seen.find(text) != std::string::npos; };
  fcntl(terminal, F_SETFL, O_NONBLOCK);
  // The rows may come before the line that tells how far it is, or after it.
  EXPECT_TRUE(Eventually([&] {
    char bytes[4096];
    const ssize_t count = read(terminal, bytes, sizeof bytes);
    if (count > 0) seen.append(bytes, size_t(count));
    return has("bro\\xFFken\\x0A.jpg") && has(", 4 found, endless.log");
  })) << seen;
  kill(program, SIGINT);
  EXPECT_EQ(Finish(program).exit_code, 130);
  close(terminal);
}

}  // namespace
}  // namespace program_test
