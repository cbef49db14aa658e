// What a search's walker and its result database leave to each other, to the task and to whoever
// lists: files that nobody claims or names, rows of files that are gone, full disks, early stops.

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <memory>
#include <set>

#include "nas/results/result_file.h"
#include "nas/system/user_state.h"
#include "nas/system/volumes.h"
#include "platform/filesearch.h"
#include "platform/task_record.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

namespace fs = std::filesystem;
using FileSearch::WfmSearchDBTask;
using FileSearch::WfmSearchWalker;

// No file of this process can grow while it lives.
class FullDisk {
 public:
  FullDisk() : handler_(std::signal(SIGXFSZ, SIG_IGN)) {
    getrlimit(RLIMIT_FSIZE, &before_);
    rlimit none = before_;
    none.rlim_cur = kBytes;
    setrlimit(RLIMIT_FSIZE, &none);
  }
  ~FullDisk() {
    setrlimit(RLIMIT_FSIZE, &before_);
    std::signal(SIGXFSZ, handler_);
  }
  FullDisk(const FullDisk&) = delete;
  FullDisk& operator=(const FullDisk&) = delete;

 private:
  static constexpr rlim_t kBytes = 64 * 1024;  // enough for a task record, not for results
  void (*handler_)(int);
  rlimit before_ = {};
};

class Walker : public PlatformTest {
 protected:
  void SetUp() override {
    PlatformTest::SetUp();
    share_ = MakeFolder("volume1/share");
    Configure();
    me_ = Me();
    ASSERT_TRUE(nas::EnterUserState(me_));
    task_ = std::make_unique<OKT::Task>(me_.c_str(), nullptr);
  }
  void TearDown() override {
    task_.reset();
    PlatformTest::TearDown();
  }

  std::unique_ptr<WfmSearchWalker> NewWalker() {
    return std::make_unique<WfmSearchWalker>(me_.c_str(), "", task_.get(), &stop_);
  }
  void NameInTask(WfmSearchWalker& walker) {
    Json::Value data;
    data[task_record::kDatabaseId] = walker.getDBTaskId();
    data[task_record::kDatabaseVolume] = walker.getDBVol();
    EXPECT_TRUE(task_->setProperty(task_record::kData, data));
  }
  static bool Walk(WfmSearchWalker& walker) {
    Json::Value options;
    options["search_content"] = false;
    return walker.Walk({}, options);
  }
  std::string ResultFolder() const { return nas::ResultFolderPath(dir_ + "/volume1", me_); }
  size_t ResultFiles() const {
    if (!fs::exists(ResultFolder())) return 0;
    return static_cast<size_t>(
        std::distance(fs::directory_iterator(ResultFolder()), fs::directory_iterator()));
  }
  std::unique_ptr<WfmSearchDBTask> OpenResults() {
    const Json::Value data = task_->getProperty(task_record::kData);
    return std::unique_ptr<WfmSearchDBTask>(
        FileSearch::WfmSearchDBTaskMgr(me_.c_str())
            .getDBTask(data[task_record::kDatabaseVolume].asCString(),
                       data[task_record::kDatabaseId].asCString()));
  }

  std::string share_;
  std::string me_;
  std::unique_ptr<OKT::Task> task_;
  int stop_ = 0;
};

// Lists as the search module does: a page in which a file's rows could be purged is asked for
// again.
struct Listing {
  WfmSearchDBTask& results;
  std::vector<std::string> names = {};
  bool consistent = true;
  unsigned long long total = 0;
  int passes = 0;

  static BOOL Take(FileSearch::__tag_FILE_INFO_DATA* row, void* context) {
    auto& listing = *static_cast<Listing*>(context);
    const std::string path = std::string(row->share_root) + "/" + row->relative_path;
    if (access(path.c_str(), F_OK) != 0) {
      listing.consistent = listing.results.delRecs(row->share_name, path) == false;
    }
    listing.names.emplace_back(row->name);
    return 1;
  }
  void Run() {
    constexpr int kMostPasses = 5;
    const bool ascending = true;
    do {
      names.clear();
      consistent = true;
      ASSERT_TRUE(results.queryResult(0, 100, "name", &ascending, nullptr, "", Take, this, &total));
    } while (!consistent && ++passes < kMostPasses);
    EXPECT_TRUE(consistent) << "it would be asked for ever";
  }
};

// Rows that cannot be purged stand behind, between and before those that can.
TEST_F(Walker, WhatIsGoneIsNeverListed) {
  for (const char* name : {"a", "c", "e"}) WriteFile(share_ + "/" + name, "x");
  for (const char* name : {"b", "d"}) {
    ASSERT_EQ(symlink("nowhere", (share_ + "/" + name).c_str()), 0);
  }
  const auto walker = NewWalker();
  ASSERT_TRUE(walker->init({"/share"}, {}));
  NameInTask(*walker);
  ASSERT_TRUE(Walk(*walker));
  const auto results = OpenResults();
  ASSERT_NE(results, nullptr);
  Listing listing{*results};
  listing.Run();
  EXPECT_EQ(listing.names, (std::vector<std::string>{"a", "b", "c", "d", "e"}));

  fs::remove(share_ + "/a");
  listing.Run();
  EXPECT_EQ(listing.names, (std::vector<std::string>{"b", "c", "d", "e"}));
  EXPECT_EQ(listing.total, 4u);
  fs::remove(share_ + "/e");
  listing.Run();
  EXPECT_EQ(listing.names, (std::vector<std::string>{"b", "c", "d"}));
  fs::remove(share_ + "/c");
  {
    const FullDisk full;
    listing.Run();
  }
  EXPECT_EQ(listing.names, (std::vector<std::string>{"b", "d"})) << "on a full disk too";
  EXPECT_EQ(listing.total, 2u);
}

// A clock that jumps and a search that finds nothing for a day look alike.
TEST_F(Walker, ItsResultsAreNotSweptWhileItLives) {
  auto walker = NewWalker();
  ASSERT_TRUE(walker->init({"/share"}, {}));
  NameInTask(*walker);
  const auto sweep_two_days_later = [&] {
    // Elsewhere, as a sweep touches the locks of databases that its own process has open.
    return InChild([&] {
      const auto then = fs::file_time_type::clock::now() - std::chrono::hours(48);
      for (const auto& file : fs::directory_iterator(ResultFolder())) {
        fs::last_write_time(file, then);
      }
      nas::SweepResultFolder(ResultFolder());
    });
  };
  const std::string path = nas::ResultPath(ResultFolder(), walker->getDBTaskId());
  ASSERT_TRUE(sweep_two_days_later());
  EXPECT_TRUE(fs::exists(path));
  ASSERT_TRUE(Walk(*walker));
  ASSERT_TRUE(sweep_two_days_later());
  EXPECT_TRUE(fs::exists(path));
  walker.reset();
  ASSERT_TRUE(sweep_two_days_later());
  EXPECT_EQ(ResultFiles(), 0u);
}

TEST_F(Walker, ResultsThatNobodyCanNameGoWithIt) {
  const auto files_after = [&](bool named, bool walked) {
    auto walker = NewWalker();
    EXPECT_TRUE(walker->init({"/share"}, {}));
    if (named) NameInTask(*walker);
    EXPECT_TRUE(!walked || Walk(*walker));
    walker.reset();
    const size_t left = ResultFiles();
    fs::remove_all(ResultFolder());
    return left;
  };
  EXPECT_EQ(files_after(false, false), 0u);
  EXPECT_GT(files_after(true, false), 0u) << "a client can ask for them and clean them";
  EXPECT_GT(files_after(true, true), 0u);
  EXPECT_TRUE(task_->remove());
  EXPECT_EQ(files_after(false, false), 0u) << "without a task";
}

TEST_F(Walker, AFailedWalkTellsHowFarItCame) {
  for (const char* name : {"a", "b", "c"}) WriteFile(share_ + "/" + name, "x");
  const auto walker = NewWalker();
  ASSERT_TRUE(walker->init({"/share"}, {}));
  NameInTask(*walker);
  {
    const FullDisk full;
    EXPECT_FALSE(Walk(*walker));
  }
  task_->reload();
  const Json::Value walk = task_->getProperty(task_record::kWalk);
  ASSERT_TRUE(walk.isObject());
  EXPECT_EQ(walk[task_record::kMatches], 3);
  EXPECT_NE(walk[task_record::kPhase], task_record::kDonePhase);
}

TEST_F(Walker, AStopEndsTheOpeningOfLocations) {
  EXPECT_TRUE(NewWalker()->init({"/nowhere", "/share"}, {}));
  stop_ = 1;
  EXPECT_FALSE(NewWalker()->init({"/nowhere", "/share"}, {})) << "the second is not looked at";
  EXPECT_TRUE(NewWalker()->init({"/share", "/nowhere"}, {})) << "there is something to list";
}

}  // namespace
}  // namespace nas_test
