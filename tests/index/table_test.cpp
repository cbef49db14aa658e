// Name tables: what is read is what is there, what is merged is what would be read, and what is
// damaged is not believed.

#include <dirent.h>
#include <fcntl.h>
#include <sys/mount.h>

#include "nas/index/table_compare.h"
#include "nas/index/table_sweep.h"
#include "nas/index/table_writer.h"
#include "tests/index/table_tree.h"

namespace index_test {
namespace {

namespace fs = std::filesystem;
using nas_test::WriteFile;
using FolderId = nas::NameTable::FolderId;

// Past the time in which a second change would leave no trace.
void LetStampsSettle() { std::this_thread::sleep_for(std::chrono::milliseconds(30)); }

// Hard links change at other names too, so their inodes are noted as events would note them.
void NoteInode(const std::string& path, nas::Changes& changes) {
  struct stat status;
  if (lstat(path.c_str(), &status) == 0) changes.AddInode(status.st_ino);
}

class Table : public TableTest {};

TEST_F(Table, IsWhatIsThereAndMergesToWhatWouldBeRead) {
  for (unsigned seed = 1; seed <= 40; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    fs::remove_all(tree_ + "/in");
    fs::create_directory(tree_ + "/in");
    RandomTree random(tree_ + "/in", seed);
    for (int i = 0; i < 60; ++i) random.Step();
    LetStampsSettle();
    const nas::NameTable old = Scan();
    ASSERT_EQ(PictureOf(old), PictureOf(tree_));
    ASSERT_EQ(Differences(old), "");

    nas::Changes changes;
    std::set<FolderId> touched;
    for (int i = 0; i < static_cast<int>(seed); ++i) {
      for (const std::string& path : random.Step()) {
        Note(old, "in/" + path, changes);
        NoteInode(tree_ + "/in/" + path, changes);
      }
    }
    const Picture now = PictureOf(tree_);
    ASSERT_EQ(Differences(old, changes), "");
    EXPECT_EQ(Differences(old) == "", PictureOf(old) == now);
    ASSERT_EQ(PictureOf(Merge(old, changes)), now);

    // Nobody noted anything: the folders' own times tell as much of names.
    nas::Changes found;
    const auto swept = nas::SweepFolders(old, Roots());
    ASSERT_TRUE(swept);
    for (const FolderId folder : *swept) found.AddFolder(folder);
    const nas::NameTable merged = Merge(old, found);
    const Picture names = PictureOf(merged);
    ASSERT_EQ(names.size(), now.size());
    EXPECT_TRUE(std::equal(names.begin(), names.end(), now.begin(),
                           [](const auto& a, const auto& b) { return a.first == b.first; }));
  }
}

}  // namespace
}  // namespace index_test
