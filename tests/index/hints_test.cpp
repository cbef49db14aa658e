// What becomes of events: noted for the table in use, kept for the one in the making, and bounded.

#include "nas/index/hints.h"

#include "nas/base/unique_fd.h"
#include "nas/index/tree_scan.h"
#include "tests/nas/fixture.h"

namespace index_test {
namespace {

constexpr char kFileSystem[] = "a test's";
constexpr size_t kMost = 20;

class HintsTest : public nas_test::PlatformTest {
 protected:
  nas::NameTable Scan() {
    const nas::UniqueFd root(open(dir_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const nas::UniqueFd place(open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const std::string name = "arbory-hints-" + std::to_string(getpid());
    const nas::Status made =
        nas::ScanTree({{root.get(), "tree"}}, {place.get(), name, kFileSystem});
    EXPECT_TRUE(made);
    auto table = nas::NameTable::Open(place.get(), name, kFileSystem);
    unlinkat(place.get(), name.c_str(), 0);
    EXPECT_TRUE(table);
    return std::move(*table);
  }
  nas::FolderKey Key(const std::string& below) {
    const nas::UniqueFd folder(open((dir_ + below).c_str(), O_PATH | O_CLOEXEC));
    return nas::KeyOf(folder.get()).value_or({});
  }
};

TEST_F(HintsTest, WhatComesWhileATableIsMadeIsSaidOfIt) {
  MakeFolder("a");
  const nas::NameTable first = Scan();
  nas::Hints hints(kMost);
  hints.Use(&first);
  hints.NameChanged(Key("/a"), "before");
  hints.BeginTable();
  MakeFolder("a/new");
  hints.NameChanged(Key("/a"), "after");
  hints.NameChanged(Key("/a/new"), "unknown to the first");
  hints.InodeChanged(7);
  EXPECT_EQ(hints.changes().folders().at(first.Find(Key("/a"))).names.size(), 2U);
  EXPECT_EQ(hints.changes().folders().size(), 1U);
  const nas::NameTable second = Scan();
  hints.Use(&second);
  using Names = std::set<std::string, std::less<>>;
  EXPECT_EQ(hints.changes().folders().at(second.Find(Key("/a"))).names, Names{"after"});
  EXPECT_EQ(hints.changes().folders().at(second.Find(Key("/a/new"))).names,
            Names{"unknown to the first"});
  EXPECT_TRUE(hints.changes().inodes().contains(7));
  EXPECT_EQ(hints.kept(), 0U);
}

TEST_F(HintsTest, WhatIsMoreThanTheBoundIsLost) {
  const nas::NameTable table = Scan();
  for (const bool making : {false, true}) {
    SCOPED_TRACE(making ? "for a table in the making" : "for the table in use");
    nas::Hints hints(kMost);
    if (making) {
      hints.BeginTable();
    } else {
      hints.Use(&table);
    }
    size_t events = 0;
    while (!hints.lost() && events < 2 * kMost) {
      hints.NameChanged(Key(""), std::to_string(events++));
      hints.NameChanged("nobody's folder", "x");
    }
    EXPECT_TRUE(hints.lost());
    EXPECT_GE(events, kMost / 2);
    EXPECT_LE(events, kMost + 1);
    hints.ForgetAll();
    EXPECT_FALSE(hints.lost());
    EXPECT_EQ(hints.changes().size(), 0U);
  }
}

}  // namespace
}  // namespace index_test
