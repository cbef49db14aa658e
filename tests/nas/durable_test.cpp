// What must survive a power cut: that everything is brought to the disk before a call returns, the
// folders that hold the names last. Whether the disk keeps its word is not ours.

#include <limits.h>
#include <sys/syscall.h>

#include <algorithm>

#include "nas/base/file_io.h"
#include "nas/base/paths.h"
#include "nas/system/user_state.h"
#include "platform/filedb.h"
#include "platform/json_file.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

using NUVA::WEBFM::FileDB;

// The names, in order, of what this process brought to the disk.
std::vector<std::string> g_synced;

void NoteSync(int fd) {
  char path[PATH_MAX];
  const std::string link = "/proc/self/fd/" + std::to_string(fd);
  const ssize_t length = readlink(link.c_str(), path, sizeof path);
  if (length > 0) g_synced.emplace_back(path, static_cast<size_t>(length));
}

class DurableTest : public PlatformTest {};

Json::Value Record(const char* pattern) {
  Json::Value record;
  record["pattern"] = pattern;
  return record;
}

TEST_F(DurableTest, WhatIsAnsweredForHasReachedTheDisk) {
  const std::string history = dir_ + "/history.db";
  const std::string journal = history + "-journal";
  const std::string settings = dir_ + "/usersettings";
  using nas::Durability;
  const auto replace = [&](Durability durability) {
    return nas::ReplaceFile(AT_FDCWD, settings, "x", 0600, durability).ok();
  };
  // Of what is replaced, a file of another name is synced before it takes this one.
  const std::string fresh = dir_ + "/" + std::string(nas::kTemporaryPrefix);
  const struct {
    const char* why;
    std::function<bool()> write;
    std::vector<std::string> synced;  // the last one at last
  } rows[] = {
      {"a new history",
       [&] { return FileDB(history).Insert(Record("a")); },
       {dir_, history, journal}},
      {"another record", [&] { return FileDB(history).Insert(Record("b")); }, {history, journal}},
      {"no records", [&] { return FileDB(history).Delete({}); }, {history, journal}},
      {"new settings", [&] { return Json::toFile(settings, Json::Value(1)); }, {fresh}},
      {"settings replaced", [&] { return Json::toFile(settings, Json::Value(2)); }, {fresh}},
      {"to be there whole", [&] { return replace(Durability::kAtomic); }, {fresh}},
      {"to be there", [&] { return replace(Durability::kFull); }, {fresh, dir_}},
      {"of no use after a power cut", [&] { return replace(Durability::kNone); }, {}},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    g_synced.clear();
    ASSERT_TRUE(row.write());
    ASSERT_EQ(g_synced.empty(), row.synced.empty());
    for (std::string& name : g_synced) {
      if (name.starts_with(fresh)) name = fresh;
    }
    for (const std::string& file : row.synced) {
      EXPECT_NE(std::ranges::find(g_synced, file), g_synced.end()) << file << " was not synced";
    }
    if (!row.synced.empty()) {
      EXPECT_EQ(g_synced.back(), row.synced.back());
    }
  }
}

// A search that is made again takes the place of its record: one change, brought to the disk once.
TEST_F(DurableTest, ARecordIsReplacedAtOnce) {
  const std::string history = dir_ + "/history.db";
  const auto syncs_of = [&](const char* pattern, bool replaces) {
    g_synced.clear();
    FileDB db(history);
    if (replaces) {
      EXPECT_TRUE(db.Delete(FileDB::Condition().SetCondition("pattern", pattern)));
    }
    EXPECT_TRUE(db.UpdateLastByTime(Record(pattern), 3));
    return g_synced.size();
  };
  syncs_of("a", false);
  const size_t once = syncs_of("b", false);
  EXPECT_EQ(syncs_of("a", true), once);
  {
    FileDB db(history);
    EXPECT_TRUE(db.Delete(FileDB::Condition().SetCondition("pattern", "b")));
    g_synced.clear();
  }
  EXPECT_FALSE(g_synced.empty()) << "what follows no write is a change of its own";
  std::vector<Json::Value> left;
  EXPECT_TRUE(FileDB(history).Select({}, left));
  EXPECT_EQ(left, std::vector<Json::Value>{Record("a")});
}

TEST_F(DurableTest, SoHaveTheFoldersItStandsIn) {
  ASSERT_TRUE(nas::EnterUserState(Me()));
  const std::string preference = nas::PreferenceFolder(Me());
  for (std::string folder = preference; folder.size() >= dir_.size();
       folder.resize(folder.rfind('/'))) {
    EXPECT_NE(std::find(g_synced.begin(), g_synced.end(), folder), g_synced.end()) << folder;
  }
}

// A replacement that fails leaves what was there, and nothing beside it.
TEST_F(DurableTest, AFailedReplacementLeavesNothing) {
  const std::string folder = MakeFolder("in");
  MakeFolder("in/taken");
  for (const auto durability :
       {nas::Durability::kNone, nas::Durability::kAtomic, nas::Durability::kFull}) {
    const auto replaced = nas::ReplaceFile(AT_FDCWD, folder + "/taken", "x", 0600, durability);
    EXPECT_EQ(replaced.error().error_number, EISDIR);
  }
  EXPECT_EQ(nas::CreateFile(AT_FDCWD, folder + "/taken", "x", 0600).error().error_number, EEXIST);
  EXPECT_EQ(nas::NamesIn(AT_FDCWD, folder).value_or({}), std::vector<std::string>{"taken"});
}

}  // namespace
}  // namespace nas_test

// Found before the C library's own by every library that this process loads.
extern "C" {
int fsync(int fd) {
  nas_test::NoteSync(fd);
  return static_cast<int>(syscall(SYS_fsync, fd));
}

int fdatasync(int fd) {
  nas_test::NoteSync(fd);
  return static_cast<int>(syscall(SYS_fdatasync, fd));
}
}
