// The record store: order, limits, replacement, and files that are not stores.

#include <climits>

#include "nas/base/json_text.h"
#include "platform/filedb.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

using NUVA::WEBFM::FileDB;

Json::Value Record(const Json::Value& pattern, int number = 0) {
  Json::Value record;
  record["pattern"] = pattern;
  record["n"] = number;
  return record;
}

class FileDBTest : public PlatformTest {
 protected:
  // The patterns of the records selected, each followed by a space.
  std::string Patterns(const FileDB::Condition& condition = {}, bool readable = true) {
    std::vector<Json::Value> records;
    EXPECT_EQ(FileDB(path()).Select(condition, records), readable);
    std::string patterns;
    for (const Json::Value& record : records) patterns += record["pattern"].asString() + " ";
    return patterns;
  }
  bool Insert(const Json::Value& record, int limit = 10) {
    FileDB db(path());
    db.SetMaxRecordNum(limit);
    db.SetPrimaryKey("pattern");
    return db.Insert(record);
  }
  std::string path() const { return dir_ + "/history.db"; }
};

TEST_F(FileDBTest, KeepsTheNewestOfEachKey) {
  EXPECT_EQ(Patterns(), "");
  EXPECT_EQ(ModeOf(path()), 0600U);
  for (int at = 1; at <= 11; ++at) ASSERT_TRUE(Insert(Record("p" + std::to_string(at), at)));
  EXPECT_EQ(Patterns(), "p11 p10 p9 p8 p7 p6 p5 p4 p3 p2 ");
  ASSERT_TRUE(Insert(Record("p5", 50)));
  EXPECT_EQ(Patterns(), "p5 p11 p10 p9 p8 p7 p6 p4 p3 p2 ");
  ASSERT_TRUE(Insert(Record("q"), 3));
  EXPECT_EQ(Patterns(), "q p5 p11 ") << "a smaller bound takes effect with the next write";
  ASSERT_TRUE(Insert(Record("r"), 0));
  EXPECT_EQ(Patterns(), "r q p5 p11 ") << "0: no bound";
  const struct {
    int offset;
    int limit;
    const char* patterns;
  } rows[] = {{0, 0, "r q p5 p11 "},
              {1, 2, "q p5 "},
              {-1, -1, "r q p5 p11 "},
              {3, 0, "p11 "},
              {4, 1, ""},
              {0, 99, "r q p5 p11 "},
              {INT_MIN, 0, "r q p5 p11 "}};
  for (const auto& row : rows) {
    FileDB::Condition condition;
    condition.offset = row.offset;
    condition.limit = row.limit;
    EXPECT_EQ(Patterns(condition), row.patterns) << row.offset << " " << row.limit;
  }
}

TEST_F(FileDBTest, ComparesValuesAsText) {
  for (const Json::Value& pattern : {Json::Value("5"), Json::Value("a'; DROP TABLE records;--"),
                                     Json::Value("\xFF"), Json::Value(""), Json::Value(true)}) {
    ASSERT_TRUE(Insert(Record(pattern)));
  }
  ASSERT_TRUE(Insert(Record(5, 1))) << "replaces the text 5";
  FileDB db(path());
  const auto matching = [&](const std::string& text) {
    std::vector<Json::Value> records;
    EXPECT_TRUE(db.Select(FileDB::Condition().SetCondition("pattern", text), records));
    return records.size();
  };
  for (const char* text : {"5", "a'; DROP TABLE records;--", "\xFF", "", "true"}) {
    EXPECT_EQ(matching(text), 1U) << text;
  }
  EXPECT_EQ(matching("missing"), 0U);
  EXPECT_TRUE(db.Delete(FileDB::Condition().SetCondition("pattern", "missing")));
  EXPECT_TRUE(db.Delete(FileDB::Condition().SetCondition("nokey", ""))) << "absent is not empty";
  EXPECT_TRUE(db.Delete(FileDB::Condition().SetCondition("pattern", "5").SetCondition("n", "0")));
  EXPECT_EQ(matching("5"), 1U) << "all conditions must hold";
  EXPECT_TRUE(db.Delete(FileDB::Condition().SetCondition("pattern", "5")));
  EXPECT_EQ(matching("5"), 0U);
  EXPECT_EQ(matching("\xFF"), 1U);
  Json::Value deep = Record("deep");
  for (int level = 0; level < nas::kJsonMaxDepth; ++level) deep["in"] = Json::Value(deep);
  for (const Json::Value& bad : {Json::Value("not an object"), deep}) {
    EXPECT_FALSE(db.Insert(bad));
    EXPECT_EQ(errno, EINVAL);
  }
  EXPECT_TRUE(db.Delete({}));
  EXPECT_EQ(Patterns(), "");
}

TEST_F(FileDBTest, WhatWasClearedIsInNoFile) {
  for (const char* pattern : {"secret", "other", "secret"}) ASSERT_TRUE(Insert(Record(pattern)));
  ASSERT_TRUE(Insert(Record(std::string(100'000, 's'))));
  ASSERT_TRUE(FileDB(path()).Delete({}));
  for (const std::string& file : {path(), path() + "-journal"}) {
    const std::string bytes = ReadFile(file);
    EXPECT_EQ(bytes.find("secret"), bytes.npos) << file;
    EXPECT_EQ(bytes.find("ssss"), bytes.npos) << file;
  }
}

TEST_F(FileDBTest, OneUnreadableRecordHidesNoOther) {
  for (const char* pattern : {"old", "middle", "new"}) ASSERT_TRUE(Insert(Record(pattern)));
  ChangeDatabase(path(),
                 "UPDATE records SET body=x'7b22' WHERE CAST(body AS TEXT) LIKE '%middle%';"
                 "INSERT INTO records(body) VALUES('5'), (''), ('[{}]'), (7)");
  EXPECT_EQ(Patterns(), "new old ");
  ASSERT_TRUE(Insert(Record("old", 1), 2));
  EXPECT_EQ(Patterns(), "old new ") << "nor takes its place";
  EXPECT_TRUE(FileDB(path()).Delete({}));
  ASSERT_TRUE(Insert(Record("next")));
  EXPECT_EQ(Patterns(), "next ");
}

// The file lies where its user can write: nothing that it brings along is run.
TEST_F(FileDBTest, RunsNothingThatAFileBringsAlong) {
  const std::tuple<const char*, const char*, bool, const char*> rows[] = {
      {"a view in the table's place",
       "ALTER TABLE records RENAME TO kept;"
       "CREATE VIEW records AS SELECT 1 AS position, CAST('{\"pattern\":\"v\"}' AS BLOB) AS body",
       false, ""},
      {"a trigger",
       "CREATE TRIGGER t AFTER INSERT ON records BEGIN DELETE FROM records WHERE position=1; END",
       true, "new old "},
  };
  for (const auto& [why, schema, inserts, patterns] : rows) {
    SCOPED_TRACE(why);
    unlink(path().c_str());
    ASSERT_TRUE(Insert(Record("old")));
    ChangeDatabase(path(), schema);
    EXPECT_EQ(Insert(Record("new")), inserts);
    EXPECT_EQ(Patterns({}, inserts), patterns);
  }
}

TEST_F(FileDBTest, LeavesAloneWhatIsNotAStore) {
  MakeFolder("directory");
  const std::string garbage(5000, 'g');
  ChangeDatabase(dir_ + "/other", "CREATE TABLE records(x)");
  ChangeDatabase(dir_ + "/log", "PRAGMA journal_mode=WAL; CREATE TABLE records(x)");
  ASSERT_TRUE(Insert(Record(std::string(20000, 'x'))));
  const std::string store = ReadFile(path());
  WriteFile(dir_ + "/one", "g");
  WriteFile(dir_ + "/hundred", garbage.substr(0, 100));
  WriteFile(dir_ + "/many", garbage);
  WriteFile(dir_ + "/cut", store.substr(0, store.size() / 2));
  std::string flipped = store;
  for (size_t at = 4096; at < 4196; ++at) flipped[at] = static_cast<char>(~flipped[at]);
  WriteFile(dir_ + "/flipped", flipped);
  const std::pair<const char*, int> rows[] = {
      {"one", EBADMSG},        {"hundred", EBADMSG},  {"many", EBADMSG},
      {"cut", EBADMSG},        {"flipped", EBADMSG},  {"other", EBADMSG},
      {"log", EBADMSG},        {"directory", EISDIR}, {"missing/file.db", ENOENT},
      {"one/file.db", ENOTDIR}};
  for (const auto& [name, error] : rows) {
    const std::string file = dir_ + "/" + name;
    const std::string before = ReadFile(file);
    FileDB db(file);
    errno = 0;
    EXPECT_FALSE(db.IsGood()) << name;
    EXPECT_EQ(errno, error) << name;
    std::vector<Json::Value> records;
    EXPECT_FALSE(db.Insert(Record("a")) || db.Delete({}) || db.Select({}, records)) << name;
    EXPECT_TRUE(ReadFile(file) == before) << name << " was changed";
  }
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    FileDB db("/usr/history.db");
    errno = 0;
    EXPECT_FALSE(db.IsGood());
    EXPECT_EQ(errno, EACCES);
  }));
  WriteFile(dir_ + "/empty", "");
  EXPECT_TRUE(FileDB(dir_ + "/empty").IsGood()) << "an empty file becomes a store";
}

TEST_F(FileDBTest, ProcessesWriteOneFileTogether) {
  constexpr int kWriters = 4;
  constexpr int kRecords = 20;
  EXPECT_TRUE(InChildren(kWriters, [&](int writer) {
    bool good = true;
    for (int at = 0; at < kRecords; ++at) {
      good = Insert(Record(std::to_string(writer) + "." + std::to_string(at)), 0) && good;
    }
    return good;
  }));
  std::vector<Json::Value> records;
  ASSERT_TRUE(FileDB(path()).Select({}, records));
  EXPECT_EQ(records.size(), static_cast<size_t>(kWriters * kRecords));
}

}  // namespace
}  // namespace nas_test
