// Task records: what several processes do to one record, and what any death leaves behind.

#include <sys/mount.h>

#include <atomic>
#include <memory>

#include "nas/base/file_io.h"
#include "nas/base/keeping.h"
#include "nas/base/random_name.h"
#include "nas/system/user_state.h"
#include "nas/tasks/task_files.h"
#include "platform/task.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

using OKT::Task;

class TasksTest : public PlatformTest {
 protected:
  void SetUp() override {
    PlatformTest::SetUp();
    ASSERT_TRUE(nas::EnterUserState(Me()));
    me_ = Me();
  }

  std::unique_ptr<Task> New() { return std::make_unique<Task>(me_.c_str(), nullptr); }
  std::unique_ptr<Task> Open(const std::string& id) {
    return std::unique_ptr<Task>(OKT::TaskMgr(me_.c_str()).getTaskWithThrow(id.c_str()));
  }
  std::string RecordFile(const std::string& id) {
    return nas::TaskFolder(me_) + "/" + id + ".json";
  }
  void Age(const std::string& path, long seconds) {
    const timespec then = {time(nullptr) - seconds, 0};
    const timespec times[] = {then, then};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0) << path;
  }

  std::string me_;
};

TEST_F(TasksTest, ABatchIsSeenAtOnceAndTheMarkStays) {
  const auto task = New();
  const auto reader = Open(task->getTaskId());
  EXPECT_TRUE(nas::IsRandomName(task->getTaskId()));
  EXPECT_EQ(ModeOf(RecordFile(task->getTaskId())), 0600U);
  task->beginUpdate();
  EXPECT_TRUE(task->setProperty("progress", 0));
  EXPECT_TRUE(task->setProperty("name", "\xFF"));
  ASSERT_TRUE(reader->reload());
  EXPECT_TRUE(reader->getProperty("progress").isNull());
  EXPECT_TRUE(task->endUpdate());
  EXPECT_TRUE(reader->getProperty("progress").isNull()) << "as of the last reading";
  ASSERT_TRUE(reader->reload());
  EXPECT_EQ(reader->getProperty("progress"), 0);
  EXPECT_EQ(reader->getProperty("name"), "\xFF") << "bytes come back";
  EXPECT_FALSE(reader->isFinished());

  task->beginUpdate();
  task->setProperty("progress", 1);
  EXPECT_TRUE(task->finish(true)) << "keeps running";
  ASSERT_TRUE(reader->reload());
  EXPECT_EQ(reader->getProperty("progress"), 1);
  EXPECT_FALSE(reader->isFinished());
  EXPECT_TRUE(reader->finish(false));
  EXPECT_TRUE(task->setProperty("late", 1)) << "may still be written";
  EXPECT_TRUE(task->isFinished()) << "and the mark is not lost";
}

TEST_F(TasksTest, ProcessesAndThreadsMergeTheirWrites) {
  constexpr int kWriters = 4;
  constexpr int kRounds = 20;
  const auto task = New();
  const std::string id = task->getTaskId();
  const auto write = [](OKT::Task& to, const std::string& name) {
    bool good = true;
    for (int round = 0; round <= kRounds; ++round) {
      good = to.setProperty(name.c_str(), round) && good;
    }
    return good;
  };
  // Threads are started behind the forks, as a lock taken by one would be the children's as well.
  EXPECT_TRUE(InChildren(kWriters, [&](int writer) {
    const auto mine = Open(id);
    if (writer > 0) return write(*mine, "w" + std::to_string(writer));
    std::atomic<bool> writing = true;
    std::atomic<bool> good = true;  // a reader always finds a whole record
    std::thread client([&] {
      const auto reader = Open(id);
      while (writing) good = reader->reload() && good;
    });
    std::thread walker([&] { good = write(*task, "walk") && good; });
    good = write(*mine, "w0") && good;
    walker.join();
    writing = false;
    client.join();
    return mine->finish(false) && good;
  }));
  ASSERT_TRUE(task->reload());
  for (const char* name : {"w0", "w1", "w2", "w3", "walk"}) {
    EXPECT_EQ(task->getProperty(name), kRounds) << name;
  }
  EXPECT_TRUE(task->isFinished());
}

TEST_F(TasksTest, ARemovedTaskIsNotBroughtBack) {
  const auto task = New();
  const auto other = Open(task->getTaskId());
  EXPECT_TRUE(other->remove());
  EXPECT_FALSE(other->remove());
  EXPECT_FALSE(task->setProperty("a", 1));
  task->beginUpdate();
  EXPECT_TRUE(task->setProperty("a", 1));
  EXPECT_FALSE(task->endUpdate());
  EXPECT_FALSE(task->finish(false));
  EXPECT_FALSE(task->reload());
  EXPECT_THROW(Open(task->getTaskId()), std::runtime_error);
  EXPECT_EQ(ReadFile(RecordFile(task->getTaskId())), "(none)");
}

TEST_F(TasksTest, ADeadWorkersTaskIsFinished) {
  auto task = New();
  const auto reader = Open(task->getTaskId());
  int ready[2];
  ASSERT_EQ(pipe(ready), 0);
  const pid_t worker = fork();
  if (worker == 0) {
    task->setProperty("step", 1);
    (void)!write(ready[1], "x", 1);
    for (;;) pause();
  }
  task.reset();  // the request that started it ends; the worker goes on
  char byte;
  ASSERT_EQ(read(ready[0], &byte, 1), 1);
  ASSERT_TRUE(reader->reload());
  EXPECT_FALSE(reader->isFinished());
  kill(worker, SIGKILL);
  waitpid(worker, nullptr, 0);
  EXPECT_FALSE(reader->isFinished()) << "as of the last reading";
  ASSERT_TRUE(reader->reload());
  EXPECT_TRUE(reader->isFinished());
  EXPECT_EQ(reader->getProperty("step"), 1);
  close(ready[0]);
  close(ready[1]);
}

TEST_F(TasksTest, OnlyIdsOfItsOwnFormBecomeAPath) {
  const std::string id = New()->getTaskId();
  WriteFile(dir_ + "/x.json", R"({"version":1,"finished":false,"properties":{}})");
  const std::string upper = "ABCDEF" + id.substr(6);
  const std::string rows[] = {"",
                              ".",
                              "../../../../x",
                              id + "/",
                              id.substr(1),
                              id + "0",
                              upper,
                              std::string(32, '0'),
                              "../" + id.substr(3)};
  for (const std::string& row : rows) EXPECT_THROW(Open(row), std::runtime_error) << row;
  EXPECT_THROW(OKT::TaskMgr(me_.c_str()).getTaskWithThrow(nullptr), std::runtime_error);
  for (const char* owner : {"", "..", "a/b", "nobody-here"}) {
    EXPECT_THROW(Task(owner, nullptr), std::runtime_error) << owner;
  }
  EXPECT_THROW(Task(nullptr, nullptr), std::runtime_error);
  EXPECT_NO_THROW(Open(id));
}

TEST_F(TasksTest, ATornRecordIsNoRecordAndStaysAsItIs) {
  const auto task = New();
  task->setProperty("long", std::string(200, 'x'));
  const std::string file = RecordFile(task->getTaskId());
  const std::string whole = ReadFile(file);
  for (size_t length = 0; length < whole.size(); ++length) {
    WriteFile(file, whole.substr(0, length));
    ASSERT_FALSE(task->reload()) << length;
    ASSERT_FALSE(task->setProperty("a", 1)) << length;
    ASSERT_EQ(ReadFile(file).size(), length);
  }
  for (const char* bad : {"[]", "{}", R"({"version":2,"finished":false,"properties":{}})",
                          R"({"version":1,"finished":0,"properties":{}})",
                          R"({"version":1,"finished":true,"properties":[]})"}) {
    WriteFile(file, bad);
    EXPECT_FALSE(task->reload()) << bad;
  }
  EXPECT_EQ(task->getProperty("long").asString().size(), 200U) << "the old state stays";
  WriteFile(file, whole);
  EXPECT_TRUE(task->reload());
}

TEST_F(TasksTest, AFailedWriteLeavesTheRecordWhole) {
  const auto task = New();
  ASSERT_TRUE(task->setProperty("a", 1));
  EXPECT_TRUE(InChild([&] {
    const FullDisk full(20);  // bytes fit, the record does not
    EXPECT_FALSE(task->setProperty("a", 2));
    EXPECT_FALSE(task->finish(false));
  }));
  EXPECT_FALSE(task->setProperty("huge", std::string(20 << 20, 'x'))) << "beyond any record";
  ASSERT_TRUE(task->reload());
  EXPECT_EQ(task->getProperty("a"), 1);
  EXPECT_FALSE(task->isFinished());
}

TEST_F(TasksTest, AFullDiskCanStillBeToldOf) {
  const std::string folder = nas::TaskFolder(me_);
  if (mount("tmpfs", folder.c_str(), "tmpfs", 0, "size=256k,mode=0700") != 0) {
    GTEST_SKIP() << "mounting needs root";
  }
  {
    const auto task = New();
    const int fd = open((folder + "/filler").c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600);
    const std::string block(4096, 'x');
    while (write(fd, block.data(), block.size()) > 0) {
    }
    close(fd);
    EXPECT_TRUE(task->setProperty("progress", -1));
    EXPECT_TRUE(task->finish(false));
    EXPECT_EQ(Open(task->getTaskId())->getProperty("progress"), -1);
  }
  EXPECT_EQ(umount(folder.c_str()), 0);
}

TEST_F(TasksTest, RunningTasksAreBoundedPerOwner) {
  std::vector<std::unique_ptr<Task>> running;
  for (int at = 0; at < nas::CurrentConfig().searches_per_user; ++at) running.push_back(New());
  EXPECT_THROW(New(), std::runtime_error);
  running[3]->finish(false);  // marked finished, though its process lives
  running[3] = New();
  EXPECT_THROW(New(), std::runtime_error);
  running[5].reset();  // its process ended without a mark
  EXPECT_NO_THROW(New());
  running[6]->remove();
  EXPECT_NO_THROW(New());
}

TEST_F(TasksTest, OldTasksAreSweptUnlessSomebodyWorksOnThem) {
  const auto alive = New();
  const std::string old = New()->getTaskId();
  const std::string recent = New()->getTaskId();
  const std::string torn = New()->getTaskId();
  const std::string folder = nas::TaskFolder(me_);
  WriteFile(RecordFile(torn), "{");
  const std::string temporary = folder + "/" + std::string(nas::kTemporaryPrefix) + "x";
  const std::string foreign = folder + "/notes.json";
  for (const std::string& name : {temporary, foreign}) {
    WriteFile(name, "");
    Age(name, nas::kKeepSeconds + 60);
  }
  for (const std::string& id : {alive->getTaskId(), old, torn, recent}) {
    Age(RecordFile(id), nas::kKeepSeconds + (id == recent ? -60 : 60));
    Age(folder + "/" + id + ".lock", nas::kKeepSeconds + 60);
  }
  New();
  for (const std::string& gone :
       {RecordFile(old), folder + "/" + old + ".lock", RecordFile(torn), temporary}) {
    EXPECT_FALSE(std::filesystem::exists(gone)) << gone;
  }
  // Nor does it touch what is not ours.
  for (const std::string& kept : {RecordFile(recent), RecordFile(alive->getTaskId()), foreign}) {
    EXPECT_TRUE(std::filesystem::exists(kept)) << kept;
  }
}

TEST_F(TasksTest, WaitsEndAsSoonAsTheyCan) {
  constexpr int kForEver = 36'000;  // far beyond what this test may take
  auto task = New();
  auto reader = Open(task->getTaskId());
  EXPECT_EQ(WaitForTaskDataReady(reader.get(), "data", 0), 0);
  const auto begun = std::chrono::steady_clock::now();
  EXPECT_EQ(WaitForTaskDataReady(reader.get(), "data", 2), 0);
  EXPECT_GE(std::chrono::steady_clock::now() - begun, std::chrono::milliseconds(200));

  std::thread writer([&] {
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    task->setProperty("data", Json::Value(Json::objectValue));
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    Json::Value data;
    data["pid"] = 5;
    task->setProperty("data", data);
  });
  EXPECT_EQ(WaitForTaskDataReady(reader.get(), "data", kForEver), 1);
  EXPECT_EQ(WaitForTaskDataKeyReady(reader.get(), "data", "pid", kForEver), 1);
  EXPECT_EQ(reader->getProperty("data")["pid"], 5) << "reloaded";
  writer.join();

  for (const bool dies : {true, false}) {
    task = New();
    reader = Open(task->getTaskId());
    std::thread ender([&] {
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
      if (dies) task.reset();
      if (!dies) Open(task->getTaskId())->remove();
    });
    EXPECT_EQ(WaitForTaskDataKeyReady(reader.get(), "data", "sdbid", kForEver), 0);
    ender.join();
  }
}

// A worker that is stopped has not ended yet: what it writes down last is still waited for, and
// once it has ended nothing is.
TEST_F(TasksTest, AWaitLastsAsLongAsSomebodyWorks) {
  const auto task = New();
  const auto reader = Open(task->getTaskId());
  EXPECT_TRUE(reader->finish(false));
  std::thread worker([&] {
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    task->setProperty("late", 1);
  });
  EXPECT_EQ(WaitForTaskDataReady(reader.get(), "late", 600), 1);
  worker.join();
}

// Whoever finds a task finished has read the last that was written of it. A record that takes a
// while to read makes room for a worker to write and end meanwhile.
TEST_F(TasksTest, AFinishedTaskHasNothingMoreToTell) {
  constexpr int kRounds = 40;
  const std::string slow(size_t{300} << 10, 'x');
  for (int round = 0; round < kRounds; ++round) {
    auto task = New();
    const auto reader = Open(task->getTaskId());
    ASSERT_TRUE(task->setProperty("slow", slow));
    std::thread worker([&] {
      ASSERT_TRUE(task->setProperty("last", 1));
      task.reset();
    });
    while (!reader->isFinished()) ASSERT_TRUE(reader->reload());
    ASSERT_EQ(reader->getProperty("last"), 1) << "of round " << round;
    worker.join();
  }
}

}  // namespace
}  // namespace nas_test
