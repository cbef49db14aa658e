// Which rows stand on the first page.

#include <random>

#include "nas/results/result_writer.h"
#include "nas/results/sort_key.h"
#include "nas/search/first_rows.h"
#include "tests/nas/fixture.h"

namespace fleet_test {
namespace {

class FirstPageTest : public nas_test::PlatformTest {};

TEST_F(FirstPageTest, IsOrderedAsAListingIs) {
  constexpr const char* kNames[] = {"IMG2.jpg", "img10.JPG", "a b", "a-b", "a",
                                    "Z",        "z.tar.gz",  "ä",   "7",   "07.txt"};
  constexpr const char* kFolders[] = {"", "a", "a-b", "a/c", "a/c10", "a/c9", "A"};
  std::mt19937 random(7);
  const auto below = [&](size_t most) { return random() % most; };
  nas::ResultWriter writer(dir_ + "/rows.db");
  writer.AddLocation(0, "share", dir_);
  nas::RowBlock block;
  for (int i = 0; i < 400; ++i) {
    block.SetFolder(0, kFolders[below(std::size(kFolders))]);
    nas::FileAttributes file;
    file.mode = below(4) == 0 ? S_IFDIR | 0755 : S_IFREG | 0600 | static_cast<mode_t>(below(8));
    file.uid = file.gid = static_cast<uid_t>(below(5));
    file.size = below(9);
    file.mtime = static_cast<std::int64_t>(below(9)) - 4;
    file.atime = file.ctime = file.crtime = -file.mtime;
    block.Add(kNames[below(std::size(kNames))], file);
  }
  writer.Append(block);
  nas::ResultReader reader(dir_ + "/rows.db");
  reader.Purge({3, 77});
  for (const auto& known : nas::kSortColumns) {
    for (const bool ascending : {true, false}) {
      SCOPED_TRACE(std::string(known.word) + (ascending ? " up" : " down"));
      reader.Begin();
      nas::Selection selection;
      selection.column = known.column;
      selection.ascending = ascending;
      const auto all = reader.Select(selection, 0, 400).numbers;
      ASSERT_EQ(all.size(), 398U);
      std::vector<std::uint32_t> told;
      std::optional<std::uint32_t> after;
      for (const size_t limit : {1, 34, 100, 263, 5}) {
        const auto more = nas::FirstRows(reader, known.column, ascending, limit, after);
        told.insert(told.end(), more.begin(), more.end());
        after = told.back();
      }
      EXPECT_EQ(told, all);
      reader.End();
    }
  }
}

TEST(FirstRowsTest, AreAsManyAsAnEvenSpreadNeeds) {
  const struct {
    unsigned page, boxes, rows;
  } rows[] = {{100, 1, 100},  {100, 5, 33}, {100, 20, 14}, {100, 100, 7},
              {100, 1000, 4}, {7, 5, 6},    {1, 5, 1}};
  for (const auto& row : rows) {
    EXPECT_EQ(nas::FirstRowsOfEach(row.page, row.boxes), row.rows) << row.page << " " << row.boxes;
  }
}

}  // namespace
}  // namespace fleet_test
