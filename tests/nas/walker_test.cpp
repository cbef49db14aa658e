// What a search's walker and its result database leave to each other, to the task and to whoever
// lists: files that nobody claims or names, full disks, early stops.

#include <memory>
#include <set>

#include "nas/base/sqlite.h"
#include "nas/results/result_file.h"
#include "nas/system/user_state.h"
#include "nas/system/volumes.h"
#include "platform/filesearch.h"
#include "platform/task_record.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

namespace fs = std::filesystem;
using FileSearch::WfmSearchWalker;

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
  std::string share_;
  std::string me_;
  std::unique_ptr<OKT::Task> task_;
  int stop_ = 0;
};

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
    EXPECT_TRUE(!walked || Walk(*walker) == (stop_ == 0));
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
  stop_ = 1;
  EXPECT_EQ(files_after(false, true), 0u) << "cleaned, as far as its task, while it stops";
}

// Who is killed while he removes results, or has no memory for the next name, leaves parts of them.
TEST_F(Walker, WhatIsLeftOfItsResultsCanBeCleaned) {
  auto walker = NewWalker();
  ASSERT_TRUE(walker->init({"/share"}, {}));
  NameInTask(*walker);
  const std::string id = walker->getDBTaskId();
  const std::string volume = walker->getDBVol();
  ASSERT_TRUE(fs::remove(nas::ResultPath(ResultFolder(), id)));
  walker.reset();
  EXPECT_GT(ResultFiles(), 0u) << "a log is not deleted with what it is no longer the log of";
  const FileSearch::WfmSearchDBTaskMgr databases(me_.c_str());
  const auto removed = [&] {
    const std::unique_ptr<FileSearch::WfmSearchDBTask> results(
        databases.getDBTask(volume.c_str(), id.c_str()));
    return results && results->remove();
  };
  EXPECT_TRUE(removed());
  EXPECT_EQ(ResultFiles(), 0u);
  EXPECT_FALSE(removed());
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

// Orderings take longer than finding what they order.
TEST_F(Walker, ManyResultsAreSortedUnlessNobodyWillAsk) {
  constexpr int kFiles = 100'000;  // as many as are worth sorting
  for (int i = 0; i < kFiles; ++i) {
    ASSERT_EQ(mknod((share_ + "/" + std::to_string(i)).c_str(), S_IFREG | 0600, 0), 0);
  }
  nas::Config config = nas::CurrentConfig();
  for (const bool kept : {true, false}) {
    SCOPED_TRACE(kept);
    config.keep_orderings = kept;
    nas::Configure(config);
    // Elsewhere, as whoever sorts may outlive the walk.
    EXPECT_TRUE(InChild([&] {
      auto walker = NewWalker();
      ASSERT_TRUE(walker->init({"/share"}, {}));
      NameInTask(*walker);
      ASSERT_TRUE(Walk(*walker));
      while (waitpid(-1, nullptr, 0) > 0) {
      }
      const std::string path =
          nas::ResultPath(nas::ResultFolderPath(walker->getDBVol(), me_), walker->getDBTaskId());
      const nas::Database results(path, SQLITE_OPEN_READWRITE, 0);
      EXPECT_EQ(nas::Statement(results, "SELECT 1 FROM ordering").Step(), kept);
    }));
  }
}

TEST_F(Walker, AStopEndsTheOpeningOfLocations) {
  EXPECT_TRUE(NewWalker()->init({"/nowhere", "/share"}, {}));
  stop_ = 1;
  EXPECT_FALSE(NewWalker()->init({"/nowhere", "/share"}, {})) << "the second is not looked at";
  EXPECT_TRUE(NewWalker()->init({"/share", "/nowhere"}, {})) << "there is something to list";
}

}  // namespace
}  // namespace nas_test
