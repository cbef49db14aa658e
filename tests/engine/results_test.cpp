// Result databases: paging, every order, filters, purging, and a listing beside a writer.

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <numeric>
#include <random>
#include <set>
#include <thread>

#include "nas/results/result_reader.h"
#include "nas/results/result_writer.h"

namespace nas {
namespace {

class Results : public testing::Test {
 protected:
  Results() { std::filesystem::create_directories(folder_); }
  ~Results() override { std::filesystem::remove_all(folder_); }

  const std::string folder_ = testing::TempDir() + "results-" + NewResultId();
  const std::string path_ = ResultPath(folder_, NewResultId());
};

std::vector<std::string> Names(ResultReader& reader, const Selection& selection) {
  reader.Begin();
  std::vector<std::string> names;
  // In pages, so that what a page is cut from does not matter.
  constexpr std::uint64_t kPage = 1'000;
  ResultReader::Page page;
  do {
    page = reader.Select(selection, names.size(), kPage);
    for (const std::uint32_t number : page.numbers) names.emplace_back(reader.Row(number).name);
  } while (page.numbers.size() == kPage);
  EXPECT_EQ(page.total, names.size());
  reader.End();
  return names;
}

TEST_F(Results, EveryColumnSorts) {
  ResultWriter writer(path_);
  writer.AddLocation(0, "share", "/s");
  writer.AddLocation(1, "Alpha", "/a");
  constexpr std::int64_t kNone = FileAttributes::kNoTime;
  // Size; the times of reading, writing, changing, making; mode and owners.
  const std::tuple<const char*, const char*, std::uint16_t, FileAttributes> rows[] = {
      {"IMG10.png", "b", 0, {5, 1, -5, 3, 9, S_IFREG | 0644, 0, 0}},
      {"img2.PNG", "a/x", 0, {1u << 30, 3, 7, 2, 8, S_IFREG | 0600, 65534, 0}},
      {"Zoo", "a", 0, {0, 2, 0, 1, kNone, S_IFDIR | 0755, 1, 0}},
      {"img002a.doc", "z", 1, {300, 4, 1, 4, 7, S_IFREG | 0640, 0, 65534}},
  };
  for (const auto& [name, folder, location, file] : rows) {
    RowBlock block;
    block.SetFolder(location, folder);
    block.Add(name, file);
    writer.Append(block);
  }
  writer.Complete();

  ResultReader reader(path_);
  const std::string a = "IMG10.png", b = "img2.PNG", c = "Zoo", d = "img002a.doc";
  const std::pair<const char*, std::vector<std::string>> orders[] = {
      {"name", {b, d, a, c}},  {"path", {d, c, b, a}},   {"size", {c, a, d, b}},
      {"type", {c, d, a, b}},  {"user", {c, b, a, d}},   {"group", {d, a, b, c}},
      {"mode", {b, d, a, c}},  {"atime", {a, c, b, d}},  {"mtime", {a, c, d, b}},
      {"ctime", {c, b, a, d}}, {"crtime", {c, d, b, a}},
  };
  for (const auto& [column, ascending] : orders) {
    Selection selection;
    selection.column = ParseSortColumn(column).value();
    EXPECT_EQ(Names(reader, selection), ascending) << column;
    selection.ascending = false;
    std::vector<std::string> descending(ascending.rbegin(), ascending.rend());
    EXPECT_EQ(Names(reader, selection), descending) << column;
  }
  EXPECT_FALSE(ParseSortColumn("name; DROP TABLE names"));

  Selection files;
  files.directories = false;
  EXPECT_EQ(Names(reader, files), (std::vector<std::string>{a, b, d}));
  Selection pngs;
  pngs.pattern = *Query::Parse("*.png");
  EXPECT_EQ(Names(reader, pngs), (std::vector<std::string>{a, b}));
}

TEST(Ordering, NaturalKeys) {
  const char* ascending[] = {"",   "a",   "A b",  "a0",    "a1",  "a01b",
                             "a2", "a10", "a10b", "a010c", "a11", "a99999999999999999999999",
                             "ab", "é",   "日"};
  TextKeys keys;
  for (const char* text : ascending) keys.AddNatural(text);
  for (size_t i = 0; i + 1 < keys.size(); ++i) {
    EXPECT_LT(keys[i], keys[i + 1]) << ascending[i] << " before " << ascending[i + 1];
  }
}

// Against the plain sort, with keys that agree in long beginnings and end inside others.
TEST(Ordering, TextsAgainstPlainSort) {
  std::mt19937 random(11);
  TextKeys keys;
  for (int i = 0; i < 30'000; ++i) {
    std::string text(random() % 40, 'a');
    if (random() % 2 == 0) text += "b" + std::to_string(random() % 50);
    if (random() % 9 == 0) text += "00";
    keys.AddNatural(text);
  }
  Ordering expected(keys.size());
  std::iota(expected.begin(), expected.end(), 0);
  std::ranges::stable_sort(expected, [&keys](auto a, auto b) { return keys[a] < keys[b]; });
  EXPECT_EQ(keys.Order(), expected);
}

// The folders of a deep tree share a path of any length.
TEST(Ordering, LongCommonFronts) {
  constexpr std::uint32_t kTexts = 210;
  const std::string front(700'000, 'd');
  TextKeys keys;
  for (std::uint32_t i = kTexts; i-- > 0;) keys.AddNatural(front + std::to_string(i));
  Ordering expected(kTexts);
  std::iota(expected.rbegin(), expected.rend(), 0);
  EXPECT_EQ(keys.Order(), expected);
}

TEST_F(Results, ManyRowsKeepTheirOrderAndPurgesHold) {
  constexpr std::uint32_t kRows = 2 * kOrderingPiece + 17;
  ResultWriter writer(path_);
  writer.AddLocation(0, "share", "/s");
  RowBlock block;
  block.SetFolder(0, "folder");
  for (std::uint32_t i = 0; i < kRows; ++i) {
    block.Add("f" + std::to_string(i), {.size = kRows - i, .mode = S_IFREG});
    if (block.full()) writer.Append(block);
  }
  writer.Append(block);
  writer.Complete();

  Selection by_size;
  by_size.column = SortColumn::kSize;
  std::vector<std::string> expected;
  for (std::uint32_t i = kRows; i-- > 0;) expected.push_back("f" + std::to_string(i));
  ResultReader reader(path_);
  EXPECT_EQ(Names(reader, by_size), expected);
  const std::uint64_t unsorted_bytes = ResultFileBytes(path_);
  reader.KeepAllOrderings();
  EXPECT_GE(ResultFileBytes(path_),
            unsorted_bytes + std::size(kSortColumns) * kRows * sizeof(std::uint32_t));
  EXPECT_EQ(Names(reader, by_size), expected) << "as kept";
  by_size.ascending = false;
  EXPECT_EQ(Names(reader, by_size), std::vector<std::string>(expected.rbegin(), expected.rend()));
  by_size.ascending = true;
  reader.Purge({0, RowBlock::kMostRows, kRows - 1});
  reader.Purge({0});
  std::erase_if(expected, [](const std::string& name) {
    return name == "f0" || name == "f2048" || name == "f" + std::to_string(kRows - 1);
  });
  ResultReader another(path_);
  EXPECT_EQ(Names(another, by_size), expected) << "a kept ordering leaves purged rows out";
  reader.Begin();
  const ResultRow row = reader.Row(RowBlock::kMostRows + 1);
  EXPECT_EQ(row.name, "f2049");
  EXPECT_EQ(row.folder, "folder");
  reader.End();
}

// Pages of a search that runs: no row twice, none missing, in the order found.
TEST_F(Results, PagesBesideAWriter) {
  constexpr std::uint32_t kRows = 20'000;
  ResultWriter writer(path_);
  writer.AddLocation(0, "share", "/s");
  std::jthread appender([&writer] {
    RowBlock block;
    for (std::uint32_t i = 0; i < kRows; ++i) {
      block.SetFolder(0, "d" + std::to_string(i / 7));
      block.Add(std::to_string(i), {});
      if (i % 97 == 0) writer.Append(block);
    }
    writer.Append(block);
  });
  ResultReader reader(path_);
  std::uint32_t next = 0;
  while (next < kRows) {
    reader.Begin();
    for (; next < reader.rows(); ++next) {
      const ResultRow row = reader.Row(next);
      ASSERT_EQ(row.name, std::to_string(next));
      ASSERT_EQ(row.folder, "d" + std::to_string(next / 7));
    }
    reader.End();
  }
}

TEST_F(Results, FilesThatAreNone) {
  EXPECT_THROW(ResultReader{path_}, SqliteError) << "a missing file is not made";
  EXPECT_FALSE(std::filesystem::exists(path_));
  std::ofstream(path_) << std::string(5'000, 'x');
  EXPECT_ANY_THROW(ResultReader{path_});
  EXPECT_EQ(std::filesystem::file_size(path_), 5'000u) << "and is left as it was";
  const std::string other = ResultPath(folder_, NewResultId());
  { Database(other, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, 0).Execute("CREATE TABLE t(a)"); }
  EXPECT_ANY_THROW(ResultReader{other}) << "another version";
  for (const char* id : {"", "x", "../x", "0123456789abcdef0123456789abcde/",
                         "0123456789ABCDEF0123456789ABCDEF", "0123456789abcdef0123456789abcdef0"}) {
    EXPECT_FALSE(IsResultId(id)) << id;
  }
}

// A search may be cleaned at any time, its worker notices later.
TEST_F(Results, RemovedBesideAWriterLeaveNothing) {
  {
    ResultWriter writer(path_);
    ASSERT_TRUE(RemoveResultFile(path_));
    RowBlock block;
    block.SetFolder(0, "folder");
    block.Add("name", {});
    writer.Append(block);
    writer.Complete();
    writer.EmptyLog();
  }
  EXPECT_TRUE(std::filesystem::is_empty(folder_));
}

TEST_F(Results, SweepKeepsWhatIsInUse) {
  const std::string fresh = ResultPath(folder_, NewResultId());
  const std::string stale = ResultPath(folder_, NewResultId());
  const std::string written = ResultPath(folder_, NewResultId());
  const std::string foreign = folder_ + "/notes.db";
  const auto long_ago = std::filesystem::file_time_type::clock::now() - std::chrono::hours(25);
  for (const std::string& path : {fresh, stale, written, foreign}) std::ofstream(path) << "x";
  std::ofstream(written + "-wal") << "x";
  const std::string orphan = ResultPath(folder_, NewResultId()) + "-wal";
  std::ofstream(orphan) << "x";
  for (const std::string& path : {stale, written, foreign, orphan}) {
    std::filesystem::last_write_time(path, long_ago);
  }
  SweepResultFolder(folder_);
  EXPECT_TRUE(std::filesystem::exists(fresh));
  EXPECT_FALSE(std::filesystem::exists(stale));
  EXPECT_FALSE(std::filesystem::exists(orphan));
  EXPECT_TRUE(std::filesystem::exists(written)) << "its log is new";
  EXPECT_TRUE(std::filesystem::exists(foreign)) << "not one of ours";
}

}  // namespace
}  // namespace nas
