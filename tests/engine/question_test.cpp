// What passes between a search and an index: queries one way, rows the other, and where mounts lie.

#include <gtest/gtest.h>

#include <algorithm>
#include <set>
#include <string>
#include <vector>

#include "nas/match/query_json.h"
#include "nas/search/mounts_below.h"
#include "nas/search/row_frame.h"

namespace nas {
namespace {

TEST(Questions, QueriesComeThroughJson) {
  const char* const queries[] = {
      "",
      "plan",
      "\"a b\" !c",
      "<a b>|c",
      "Plan",
      "case:Plan",
      "*?",
      "regex:^a+",
      "case:a regex:b",
      "ext:jpg,PNG",
      "type:folder,image",
      "size:1K..2K,>1G",
      "modified:today",
      "owner:root",
      "depth:<3",
      "empty:",
      "src/**/*.{c,h}",
      "\"*?\"",
      "content:needle",
      "type:file,link,x",
      "exclude:a,b/ hidden:no",
      "ignored:no",
      "mounts:no",
      "letters:exact plan",
      "caf\xc3\xa9/b",
  };
  std::set<Json::Value> different;
  for (const char* text : queries) {
    const auto query = Query::Parse(text);
    ASSERT_TRUE(query) << text;
    const Json::Value json = QueryToJson(query->root());
    EXPECT_TRUE(different.insert(json).second) << text;
    const auto back = QueryFromJson(json);
    ASSERT_TRUE(back) << text;
    EXPECT_EQ(QueryToJson(*back), json) << text;
    // Kinds and values, and whatever a document cannot be without.
    for (Json::ArrayIndex i = 0; i < json.size(); ++i) {
      Json::Value damaged = json;
      damaged[i] = Json::Value(Json::objectValue);
      EXPECT_FALSE(QueryFromJson(damaged)) << text << " " << i;
    }
  }
}

RowBlock SomeRows() {
  RowBlock block;
  for (const char* folder : {"docs", "docs/old"}) {
    block.SetFolder(0, folder);
    block.Add("one", {});
    block.Add("two", {});
  }
  return block;
}

TEST(Questions, FramesOfRowsAreTakenWholeOrNotAtAll) {
  std::string frame;
  WriteRowFrame(SomeRows(), frame);
  RowBlock block;
  ASSERT_TRUE(ReadRowFrame(frame, 7, "docs", block));
  EXPECT_EQ(block.size(), 4U);
  EXPECT_FALSE(ReadRowFrame(frame, 7, "doc", block)) << "of another folder";
  EXPECT_EQ(block.size(), 0U);
  for (size_t length = 0; length < frame.size(); ++length) {
    EXPECT_FALSE(ReadRowFrame(frame.substr(0, length), 7, "", block)) << length;
    EXPECT_EQ(block.size(), 0U);
  }
  // Any byte may be another: what is taken then has names for its rows, and folders for its names.
  for (size_t at = 0; at < frame.size(); ++at) {
    for (const unsigned flip : {0x01U, 0x80U, 0xffU}) {
      std::string damaged = frame;
      damaged[at] = static_cast<char>(static_cast<unsigned char>(damaged[at]) ^ flip);
      if (!ReadRowFrame(damaged, 7, "", block)) continue;
      size_t names = 0;
      block.EachFolder([&](std::string_view, std::string_view of_folder) {
        names += static_cast<size_t>(std::count(of_folder.begin(), of_folder.end(), '\0'));
      });
      EXPECT_EQ(names, block.size()) << at;
    }
  }
}

TEST(Questions, MountsBelowAFolder) {
  const std::string mounts =
      "21 1 8:1 / / rw shared:1 - ext4 /dev/sda rw\n"
      "22 21 8:2 / /data/photo rw - ext4 /dev/sdb rw\n"
      "23 21 8:2 / /data/photo/a\\040b\\134c rw - ext4 /dev/sdb rw\n"
      "24 22 8:3 /sub /data/photo/new rw - btrfs /dev/sdc rw\n"
      "25 22 8:4 / /data/photo/new rw - tmpfs none rw\n"
      "26 21 8:5 / /data/photos rw - tmpfs none rw\n"
      "torn line\n";
  using Places = std::vector<std::string>;
  const struct {
    const char* folder;
    Places below;
  } rows[] = {
      {"/data/photo", {"a b\\c", "new"}},
      {"/data/photo/new", {}},
      {"/dat", {}},
      {"/", {"data/photo", "data/photo/a b\\c", "data/photo/new", "data/photos"}},
  };
  for (const auto& row : rows) EXPECT_EQ(MountsBelow(mounts, row.folder), row.below) << row.folder;
}

}  // namespace
}  // namespace nas
