// The walk itself, on trees that break walkers: deeper than a path may be long, wider than a
// buffer, changing while they are read, given twice. What criteria select is tested through the
// program.

#include <dirent.h>
#include <sys/mount.h>
#include <sys/resource.h>

#include <atomic>
#include <cstdlib>
#include <fstream>
#include <set>

#include "nas/base/deadline.h"
#include "nas/results/result_reader.h"
#include "nas/results/result_writer.h"
#include "nas/search/content_reading.h"
#include "nas/search/folder_walk.h"
#include "nas/search/search_job.h"
#include "tests/nas/fixture.h"

namespace nas {
namespace {

class Job : public nas_test::PlatformTest {
 protected:
  void SetUp() override {
    PlatformTest::SetUp();
    base_ = dir_;
    tree_ = MakeFolder("tree");
    MakeFolder("results");
    Configure({{"tree", tree_}});
  }

  void Touch(const std::string& name, const std::string& content = "") {
    std::ofstream(tree_ + "/" + name) << content;
  }

  // The paths that a search for `pattern` finds, each once.
  std::set<std::string> Find(const std::string& pattern_text,
                             const std::vector<std::string>& texts = {"/tree"},
                             bool content = false) {
    std::vector<Location> locations;
    for (const std::string& text : texts) locations.push_back(std::move(*OpenLocation(text)));
    NodeComp pattern(Query::Parse(pattern_text)->root());
    const std::string path = ResultPath(base_ + "/results", NewResultId());
    {
      ResultWriter writer(path);
      for (size_t i = 0; i < locations.size(); ++i) {
        writer.AddLocation(static_cast<std::uint16_t>(i), locations[i].share.name,
                           locations[i].share.root);
      }
      SharedSearch search({&pattern}, writer, stop_);
      search.SearchContents(base_ + "/results", content);
      FolderWalk walk(locations, true, search);
      ContentReading contents(locations, search);
      SearchJob job(search, {.report = [this](const WalkProgress&) { ++reports_; },
                             .stuck = [this] { ++stuck_; }});
      completed_ = job.Run(walk, contents);
      progress_ = search.progress.ToJson();
    }
    std::set<std::string> found;
    ResultReader reader(path);
    reader.Begin();
    for (std::uint32_t i = 0; i < reader.rows(); ++i) {
      const ResultRow row = reader.Row(i);
      std::string relative(row.folder);
      relative.append(relative.empty() ? "" : "/").append(row.name);
      EXPECT_TRUE(found.insert(relative).second) << relative << " twice";
    }
    reader.End();
    return found;
  }

  std::string base_;
  std::string tree_;
  int stop_ = 0;
  std::atomic<int> reports_ = 0;
  int stuck_ = 0;
  bool completed_ = false;
  Json::Value progress_;
};

TEST_F(Job, ChainDeeperThanAPathMayBeLong) {
  constexpr int kDepth = 1'000;
  const std::string name = "a folder of the chain";  // 22,000 bytes of path in all
  int fd = open(tree_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  for (int i = 0; i < kDepth; ++i) {
    ASSERT_EQ(mkdirat(fd, name.c_str(), 0755), 0);
    const int below = openat(fd, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    close(fd);
    fd = below;
    const int file = openat(fd, "leaf", O_CREAT | O_WRONLY | O_CLOEXEC, 0644);
    ASSERT_EQ(write(file, "deep word", 9), 9);
    close(file);
  }
  close(fd);
  EXPECT_EQ(Find("leaf").size(), kDepth);
  EXPECT_EQ(Find("word", {"/tree"}, true).size(), kDepth) << "contents too";
  EXPECT_EQ(progress_["skipped"]["other"].asInt(), 0);
}

TEST_F(Job, HugeFolderAndManyFolders) {
  constexpr int kFiles = 20'000;
  constexpr int kFolders = 3'000;
  for (int i = 0; i < kFiles; ++i) Touch("file " + std::to_string(i));
  for (int i = 0; i < kFolders; ++i) {
    std::filesystem::create_directory(tree_ + "/sub " + std::to_string(i));
    Touch("sub " + std::to_string(i) + "/file");
  }
  EXPECT_EQ(Find("file").size(), kFiles + kFolders);
  EXPECT_EQ(progress_["folders"].asInt(), kFolders + 1);
  EXPECT_EQ(progress_["entries"].asInt(), kFiles + 2 * kFolders);
  EXPECT_EQ(progress_["matches"].asInt(), kFiles + kFolders);
  EXPECT_TRUE(completed_);
}

// Its threads wait until others go first, or for longer than that may take.
class Patient : public NameSource {
 public:
  Patient(SharedSearch& search, bool finds) : search_(search), finds_(finds) {}
  void Feed(size_t /*thread*/, Judge& /*judge*/) override {
    constexpr int kMostSeconds = 20;
    if (finds_) search_.progress.AddMatch();
    const Deadline end(1000 * kMostSeconds);
    while (Niceness() == before_ && !end.passed()) usleep(1000);
    if (Niceness() > before_) ++behind;
  }
  std::atomic<int> behind = 0;

 private:
  static int Niceness() { return getpriority(PRIO_PROCESS, 0); }

  SharedSearch& search_;
  const bool finds_;
  const int before_ = Niceness();
};

TEST_F(Job, ItsThreadsLetOthersGoFirstAfterTheFirstRowsOrWithoutAny) {
  constexpr int kThreads = 3;
  constexpr int kLast = 19;
  if (getpriority(PRIO_PROCESS, 0) == kLast) GTEST_SKIP() << "none can be behind this process";
  for (const bool finds : {true, false}) {
    ResultWriter writer(ResultPath(base_ + "/results", NewResultId()));
    NodeComp word(Query::Parse("word")->root());
    SharedSearch search({&word}, writer, stop_);
    search.SearchContents(base_ + "/results", true);
    Patient names(search, finds);
    Patient contents(search, false);
    SearchJob job(search, {.report = [](const WalkProgress&) {}, .threads = kThreads});
    const int before = getpriority(PRIO_PROCESS, 0);
    EXPECT_TRUE(job.Run(names, contents));
    EXPECT_EQ(names.behind, kThreads);
    EXPECT_EQ(contents.behind, kThreads) << "the second phase's too";
    EXPECT_EQ(getpriority(PRIO_PROCESS, 0), before) << "but not the one that shows their rows";
  }
}

TEST_F(Job, LocationsInsideOneAnotherAreWalkedOnce) {
  std::filesystem::create_directories(tree_ + "/a/b/c");
  for (const char* name : {"x1", "a/x2", "a/b/x3", "a/b/c/x4"}) Touch(name);
  const std::set<std::string> all = {"x1", "a/x2", "a/b/x3", "a/b/c/x4"};
  EXPECT_EQ(Find("x", {"/tree", "/tree/a/b", "/tree/a"}), all);
  EXPECT_EQ(Find("x", {"/tree/a/b", "/tree", "/tree//./a/b/"}), all);
  EXPECT_EQ(Find("x", {"/tree/a/b"}), (std::set<std::string>{"a/b/x3", "a/b/c/x4"}));
}

TEST_F(Job, LinksLoopsPipesAndTemporaryFolders) {
  std::filesystem::create_directories(tree_ + "/real");
  Touch("real/x1", "needle");
  std::filesystem::create_directory_symlink("..", tree_ + "/real/x2-loop");
  std::filesystem::create_symlink("/etc/passwd", tree_ + "/x3-link");
  ASSERT_EQ(mkfifo((tree_ + "/needle-pipe").c_str(), 0644), 0);
  ASSERT_EQ(mkfifo((tree_ + "/pipe").c_str(), 0644), 0);
  EXPECT_EQ(Find("x"), (std::set<std::string>{"real/x1", "real/x2-loop", "x3-link"}));
  EXPECT_EQ(Find("needle", {"/tree"}, true), (std::set<std::string>{"real/x1", "needle-pipe"}));

  // The tree now holds a volume: its @tmp is left out, a user's folder of that name is not.
  std::filesystem::create_directories(base_ + "/volume1/@tmp/webfm");
  std::filesystem::create_directories(base_ + "/volume1/docs/@tmp");
  std::ofstream(base_ + "/volume1/@tmp/webfm/y1");
  std::ofstream(base_ + "/volume1/docs/@tmp/y2");
  Configure({{"all", base_}});
  EXPECT_EQ(Find("y", {"/all"}), (std::set<std::string>{"volume1/docs/@tmp/y2"}));
  EXPECT_TRUE(OpenLocation("/all/volume1/docs/@tmp"));
  EXPECT_FALSE(OpenLocation("/all/volume1/@tmp"));
  EXPECT_FALSE(OpenLocation("/all/volume1/@tmp/webfm"));
}

TEST_F(Job, PseudoFileSystemsAreNotEntered) {
  std::filesystem::create_directories(tree_ + "/proc");
  std::filesystem::create_directories(tree_ + "/tmpfs");
  if (mount("proc", (tree_ + "/proc").c_str(), "proc", 0, nullptr) != 0) {
    GTEST_SKIP() << "mounting needs root";
  }
  ASSERT_EQ(mount("tmpfs", (tree_ + "/tmpfs").c_str(), "tmpfs", 0, nullptr), 0);
  Touch("tmpfs/status");
  EXPECT_EQ(Find("status"), (std::set<std::string>{"tmpfs/status"}));
  umount((tree_ + "/proc").c_str());
  umount((tree_ + "/tmpfs").c_str());
}

TEST_F(Job, FileSystemThatTellsNoTypes) {
  const std::string image = base_ + "/image";
  const std::string make = "truncate -s 8M " + image + " && mkfs.ext2 -q -O ^filetype " + image +
                           " && mount -o loop " + image + " " + tree_ + " 2>/dev/null";
  if (std::system(make.c_str()) != 0) GTEST_SKIP() << "mounting needs root and a loop device";
  std::filesystem::create_directories(tree_ + "/a/b");
  Touch("a/x1", "needle");
  Touch("a/b/x2");
  std::filesystem::create_symlink("b", tree_ + "/a/x3");
  ASSERT_EQ(mkfifo((tree_ + "/a/pipe").c_str(), 0644), 0);
  DIR* stream = opendir((tree_ + "/a").c_str());
  EXPECT_EQ(readdir(stream)->d_type, DT_UNKNOWN) << "or this tests nothing";
  closedir(stream);
  EXPECT_EQ(Find("x"), (std::set<std::string>{"a/x1", "a/b/x2", "a/x3"}));
  EXPECT_EQ(Find("needle", {"/tree"}, true), (std::set<std::string>{"a/x1"}));
  EXPECT_EQ(umount(tree_.c_str()), 0);
}

TEST_F(Job, FoldersVanishingDuringTheWalk) {
  for (int i = 0; i < 500; ++i) {
    std::filesystem::create_directories(tree_ + "/going/" + std::to_string(i) + "/a/b");
    std::filesystem::create_directories(tree_ + "/staying/" + std::to_string(i));
    Touch("staying/" + std::to_string(i) + "/x");
  }
  std::jthread remover([this] { std::filesystem::remove_all(tree_ + "/going"); });
  EXPECT_EQ(Find("x").size(), 500u);
  EXPECT_TRUE(completed_);
  EXPECT_EQ(progress_["skipped"]["other"].asInt(), 0);
}

TEST_F(Job, TheStopFlagEndsIt) {
  for (int i = 0; i < 200; ++i)
    std::filesystem::create_directories(tree_ + std::to_string(i) + "/a");
  // A file that takes hours to read.
  Touch("big");
  ASSERT_EQ(truncate((tree_ + "/big").c_str(), off_t{1} << 40), 0);
  std::fstream big(tree_ + "/big");
  big << std::string(64 * 1024, 'x');
  big.close();
  std::jthread stopper([this](const std::stop_token& over) {
    while (reports_ < 2 && !over.stop_requested()) std::this_thread::yield();
    __atomic_store_n(&stop_, 1, __ATOMIC_RELAXED);
  });
  EXPECT_TRUE(Find("needle", {"/tree"}, true).empty());
  EXPECT_FALSE(completed_);
}

// An expression that needs some seconds for the file, however often it is told to stop.
TEST_F(Job, TellsOfThreadsThatDoNotStop) {
  std::string lines;
  while (lines.size() < 20'000) lines += std::string(26, 'a') + "b\n";
  Touch("bomb", lines + "c");
  std::jthread stopper([this](const std::stop_token& over) {
    while (reports_ < 4 && !over.stop_requested()) std::this_thread::yield();
    __atomic_store_n(&stop_, 1, __ATOMIC_RELAXED);
  });
  EXPECT_TRUE(Find("regex:(a|aa)+$c", {"/tree"}, true).empty());
  EXPECT_EQ(stuck_, 1);
}

TEST_F(Job, LocationErrors) {
  std::filesystem::create_directories(tree_ + "/in");
  Touch("file");
  std::filesystem::create_directory_symlink("/etc", tree_ + "/out");
  std::filesystem::create_directory_symlink("in", tree_ + "/alias");
  const std::pair<int, std::vector<std::string>> rows[] = {
      {0, {"/tree", "/tree/", "//tree//in/.", "/tree/alias"}},
      {0x9A00,
       {"", "tree", "/", "/tree/..", "/tree/in/../in", "/tree/out",
        "/tree/" + std::string(5'000, 'a'), std::string("/tree/in\0x", 10)}},
      {0x0600, {"/tree/file", "/tree/none", "/none", "/Tree"}},
  };
  for (const auto& [error, texts] : rows) {
    for (const std::string& text : texts) {
      const auto location = OpenLocation(text);
      EXPECT_EQ(location ? kErrorNone : location.error().kind, error) << text.substr(0, 40);
    }
  }
}

}  // namespace
}  // namespace nas
