// Name tables: what is read is what is there, what is merged is what would be read, and what is
// damaged is not believed.

#include <dirent.h>
#include <fcntl.h>
#include <sys/mount.h>

#include <algorithm>

#include "nas/index/hints.h"
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
  for (unsigned seed = 1; seed <= 25; ++seed) {
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

std::string KeyAt(const std::string& path) {
  const nas::UniqueFd fd(open(path.c_str(), O_PATH | O_CLOEXEC));
  return nas::KeyOf(fd.get()).value_or({});
}

// The path of a folder that a table knows by its key.
std::string Found(const nas::NameTable& table, const std::string& key) {
  FolderId id = table.Find(key);
  if (id == nas::NameTable::kNoFolder) return "(none)";
  std::string path;
  for (; table.parent(id) != nas::NameTable::kNoFolder; id = table.parent(id)) {
    path = "/" + std::string(table.folder_name(id)) + path;
  }
  return path;
}

size_t Knowing(const nas::NameTable& table, const std::string& key) {
  size_t count = 0;
  for (FolderId id = 0; id < table.folders(); ++id) count += table.key(id) == key ? 1 : 0;
  return count;
}

// Moved between the reading of the place that it left and of the one that it came to.
TEST_F(Table, HasAFolderOnceThatIsMovedMeanwhile) {
  fs::create_directories(Path("a/moved/deep/deeper"));
  fs::create_directories(Path("b/c"));
  LetStampsSettle();
  const nas::NameTable before = Scan("before");
  const std::string moved = KeyAt(Path("a/moved"));
  const std::string deeper = KeyAt(Path("a/moved/deep/deeper"));
  const std::string c = KeyAt(Path("b/c"));
  nas::ScanOptions options;
  options.threads = 1;
  options.before_reading = [&](int, const nas::FolderKey& key) {
    if (key == c) rename(Path("a/moved").c_str(), Path("b/c/moved").c_str());
  };
  const nas::NameTable scanned = Scan("scanned", options);
  ASSERT_TRUE(fs::exists(Path("b/c/moved")));
  for (const std::string& key : {moved, deeper}) EXPECT_EQ(Knowing(scanned, key), 1U);
  EXPECT_EQ(Found(scanned, deeper), "/b/c/moved/deep/deeper");

  // The same while only the folder it comes to is read again.
  ASSERT_EQ(rename(Path("b/c/moved").c_str(), Path("a/moved").c_str()), 0);
  nas::Changes changes;
  changes.AddName(before.Find(c), "x");
  ASSERT_TRUE(nas::MergeTable(before, changes, false, Roots(), Place("merged"), options));
  ASSERT_TRUE(fs::exists(Path("b/c/moved")));
  EXPECT_EQ(PictureOf(*Open("merged")), PictureOf(tree_));
}

// A tree that changes faster than it is read again.
TEST_F(Table, HasAFolderOnceThatIsMovedEachTimeItIsRead) {
  constexpr int kMoves = 5;
  const auto place = [](int move) { return "from" + std::to_string(move); };
  for (int i = 0; i < kMoves; ++i) fs::create_directories(Path(place(i) + "/moved/below"));
  fs::create_directories(Path("to"));
  const nas::NameTable before = Scan("before");
  const FolderId to = before.Find(KeyAt(Path("to")));
  nas::Changes changes;
  changes.AddName(to, "x");
  nas::Changes told;
  int moves = 0;
  nas::ScanOptions options;
  options.threads = 1;
  std::vector<std::string> moved;
  options.before_reading = [&](int, const nas::FolderKey& key) {
    if (key != before.key(to) || moves == kMoves) return;
    const std::string name = place(moves++);
    moved.push_back(KeyAt(Path(name + "/moved/below")));
    fs::rename(Path(name + "/moved"), Path("to/" + name));
  };
  ASSERT_TRUE(nas::MergeTable(before, changes, false, Roots(), Place("merged"), options));
  ASSERT_LT(moves, kMoves);
  const auto merged = Open("merged");
  ASSERT_TRUE(merged);
  for (const std::string& key : moved) EXPECT_EQ(Knowing(*merged, key), 1U);
  for (int i = 0; i < moves; ++i) {
    Note(*merged, place(i) + "/moved", told);
    Note(*merged, "to/" + place(i), told);
  }
  EXPECT_EQ(Differences(*merged, told), "");
}

// Each, done behind the table's back with only the folder hinted at that an event would name.
TEST_F(Table, MergesWhatIsMore) {
  struct Case {
    const char* why;
    const char* hinted;  // below the root
    std::function<void(const std::string& tree)> change;
  };
  const std::vector<Case> cases = {
      {"nothing", "", [](const std::string&) {}},
      {"the top's own entries", "", [](const std::string& tree) { WriteFile(tree + "/new", ""); }},
      {"another folder of the same name", "a",
       [](const std::string& tree) {
         fs::remove_all(tree + "/a/b");
         fs::create_directories(tree + "/a/b/other");
       }},
      {"a hint below a folder that has gone", "a/b/c",
       [](const std::string& tree) { fs::remove_all(tree + "/a/b"); }},
      {"a hint below a folder that was replaced", "a/b/c",
       [](const std::string& tree) {
         fs::remove_all(tree + "/a");
         fs::create_directories(tree + "/a/b/c/d");
       }},
      {"a folder for a file", "a",
       [](const std::string& tree) {
         fs::remove(tree + "/a/file");
         fs::create_directories(tree + "/a/file/x");
       }},
      {"a file for a folder", "a",
       [](const std::string& tree) {
         fs::remove_all(tree + "/a/b");
         WriteFile(tree + "/a/b", "x");
       }},
      {"a known folder that was moved", "a/b/c",
       [](const std::string& tree) { fs::rename(tree + "/z", tree + "/a/b/c/z"); }},
      {"a folder's own row", "a/b/c",
       [](const std::string& tree) {
         const timespec times[] = {{1, 0}, {1, 0}};
         ASSERT_EQ(utimensat(AT_FDCWD, (tree + "/a/b/c").c_str(), times, 0), 0);
       }},
      {"all gone", "",
       [](const std::string& tree) {
         for (const char* name : {"a", "z"}) fs::remove_all(tree + "/" + name);
       }},
  };
  for (const Case& test : cases) {
    SCOPED_TRACE(test.why);
    fs::remove_all(Path("a"));
    fs::remove_all(Path("z"));
    fs::create_directories(Path("a/b/c/d"));
    fs::create_directories(Path("z/y/x"));
    WriteFile(Path("a/file"), "123");
    WriteFile(Path("z/y/file"), "1");
    const nas::NameTable old = Scan();
    FolderId folder = old.Find(KeyAt(Path(test.hinted)));
    ASSERT_NE(folder, nas::NameTable::kNoFolder);
    test.change(tree_);
    nas::Changes changes;
    changes.AddName(folder, "x");
    // Of an emptied one its entry tells more.
    if (std::string(test.why) == "a known folder that was moved") changes.AddName(0, "z");
    EXPECT_EQ(PictureOf(Merge(old, changes)), PictureOf(tree_));
  }
}

// No byte of a table can change, go or come unseen.
TEST_F(Table, IsNotBelievedOnceDamaged) {
  fs::create_directories(Path("a/Folder"));
  WriteFile(Path("a/Stra\u00dfe.txt"), "x");
  WriteFile(Path("plain"), "");
  Scan();
  const std::string sound = nas_test::ReadFile(tables_ + "/names");
  ASSERT_GT(sound.size(), sizeof(nas::TableHeader));
  const auto refused = [&](const std::string& bytes) {
    WriteFile(tables_ + "/names", bytes);
    const auto table = Open("names");
    return !table &&
           (table.error().error_number == EBADMSG || table.error().error_number == ESTALE);
  };
  for (size_t at = 0; at < sound.size(); ++at) {
    std::string flipped = sound;
    flipped[at] = static_cast<char>(flipped[at] ^ (1 << at % 8));
    ASSERT_TRUE(refused(flipped)) << "byte " << at;
  }
  for (size_t bytes = 0; bytes < sound.size(); ++bytes) {
    ASSERT_TRUE(refused(sound.substr(0, bytes))) << bytes << " bytes";
  }
  EXPECT_TRUE(refused(sound + std::string(nas::kColumnAlignment, '\0')));
  EXPECT_FALSE(refused(sound));
  for (const char* other : {"", "another", "the test's own "}) {
    const auto table = nas::NameTable::Open(table_folder_.get(), "names", other);
    ASSERT_FALSE(table);
    EXPECT_EQ(table.error().error_number, ESTALE);
  }
}

// A failure leaves the table that was there, and nothing else.
TEST_F(Table, StaysWhereNoNewOneCanBeWritten) {
  Scan();
  const std::string sound = nas_test::ReadFile(tables_ + "/names");
  for (int i = 0; i < 3000; ++i) WriteFile(Path(std::string(200, 'n') + std::to_string(i)), "");
  {
    nas_test::FullDisk disk;
    EXPECT_FALSE(nas::ScanTree(Roots(), Place("names")));
  }
  const std::atomic<bool> stop = true;
  nas::ScanOptions options;
  options.stop = &stop;
  EXPECT_EQ(nas::ScanTree(Roots(), Place("names"), options).error().error_number, ECANCELED);
  EXPECT_EQ(nas_test::ReadFile(tables_ + "/names"), sound);
  EXPECT_EQ(std::distance(fs::directory_iterator(tables_), fs::directory_iterator()), 1);
}

// Two folders at each level, and more levels than descriptors.
TEST_F(Table, ReachesDeeperThanDescriptorsDo) {
  constexpr int kLevels = 900;
  nas::UniqueFd at(openat(root_.get(), ".", O_PATH | O_CLOEXEC));
  for (int i = 0; i < kLevels; ++i) {
    ASSERT_EQ(mkdirat(at.get(), "beside", 0755), 0);
    ASSERT_EQ(mkdirat(at.get(), "aaa", 0755), 0);
    at = nas::UniqueFd(openat(at.get(), "aaa", O_PATH | O_CLOEXEC));
  }
  EXPECT_TRUE(nas_test::InChild([&] {
    const rlimit few = {400, 400};
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &few), 0);
    const nas::NameTable table = Scan();
    EXPECT_EQ(table.folders(), 2U * kLevels + 1);
    EXPECT_EQ(Differences(table), "");
    EXPECT_TRUE(nas::SweepFolders(table, Roots()));
    nas::Changes changes;
    for (FolderId id = 0; id < table.folders(); ++id) changes.AddFolder(id);
    EXPECT_EQ(Merge(table, changes).folders(), table.folders());
  }));
}

// Those beyond the descriptors are opened by paths, which lead nowhere for a while.
TEST_F(Table, HasEntriesOfAFolderThatIsAwayMeanwhile) {
  constexpr int kLevels = 300;
  nas::UniqueFd at(openat(root_.get(), ".", O_PATH | O_CLOEXEC));
  for (int i = 0; i < kLevels; ++i) {
    ASSERT_EQ(mkdirat(at.get(), "beside", 0755), 0);
    ASSERT_EQ(mkdirat(at.get(), "aaa", 0755), 0);
    at = nas::UniqueFd(openat(at.get(), "aaa", O_PATH | O_CLOEXEC));
  }
  nas::ScanOptions options;
  options.threads = 1;
  int read = 0;
  options.before_reading = [&](int, const nas::FolderKey&) {
    ++read;
    if (read == kLevels - 1) fs::rename(Path("aaa"), Path("away"));
    if (read == kLevels) fs::rename(Path("away"), Path("aaa"));
  };
  const nas::NameTable table = Scan("names", options);
  EXPECT_LT(table.folders(), 2U * kLevels - 2);
  EXPECT_EQ(table.entries(), 2U * kLevels - 2);  // the last two lie in one that could not be had
}

TEST_F(Table, OfAnOrdinaryUserLearnsWhenAFolderOpens) {
  struct Case {
    const char* why;
    mode_t mode;
    bool unreadable;
  };
  for (const Case& test : {Case{"closed", 0, true}, Case{"lists its names alone", 0444, false}}) {
    SCOPED_TRACE(test.why);
    fs::create_directories(Path("folder/inside/below"));
    ASSERT_EQ(chmod(tables_.c_str(), 0777), 0);
    ASSERT_EQ(chmod(Path("folder").c_str(), test.mode), 0);
    EXPECT_TRUE(nas_test::InOrdinaryChild([&](const std::string&) {
      const nas::NameTable table = Scan();
      ASSERT_EQ(table.folders(), 2U);
      EXPECT_EQ(table.unreadable(1), test.unreadable);
      // What is known to be there can be walked.
      EXPECT_EQ(table.strays().size(), test.unreadable ? 0U : 1U);
      EXPECT_EQ(Differences(table), "");
    }));
    ASSERT_EQ(chmod(Path("folder").c_str(), 0755), 0);
    EXPECT_TRUE(nas_test::InOrdinaryChild([&](const std::string&) {
      const auto table = Open("names");
      ASSERT_TRUE(table);
      EXPECT_NE(Differences(*table), "");
      nas::Hints hints(10);
      hints.Use(&*table);
      hints.NameChanged(table->key(0), "folder");
      if (!test.unreadable) hints.FolderChanged(table->key(1));  // that is watched
      EXPECT_EQ(Differences(*table, hints.changes()), "");
      EXPECT_EQ(PictureOf(Merge(*table, hints.changes())), PictureOf(tree_));
    }));
  }
}

TEST_F(Table, LeavesOutMountsAndOtherTrees) {
  SKIP_UNLESS_ROOT();
  for (const char* name : {"a/below", "b", "bound", "mounted", "plain/inside"}) {
    fs::create_directories(Path(name));
  }
  EXPECT_TRUE(nas_test::InChild([&] {
    ASSERT_EQ(unshare(CLONE_NEWNS), 0);
    ASSERT_EQ(mount("", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
    ASSERT_EQ(mount("none", Path("mounted").c_str(), "tmpfs", 0, nullptr), 0);
    ASSERT_EQ(mount(Path("b").c_str(), Path("bound").c_str(), nullptr, MS_BIND, nullptr), 0);
    const nas::UniqueFd top(open(tree_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const nas::UniqueFd a(open(Path("a").c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const std::vector<nas::TableRoot> roots = {{top.get(), "tree"}, {a.get(), "a of tree"}};
    ASSERT_TRUE(nas::ScanTree(roots, Place("names")));
    const auto table = Open("names");
    ASSERT_TRUE(table);
    std::set<std::string> folders;
    for (const auto& [path, told] : PictureOf(*table)) {
      if (told.ends_with("folder")) folders.insert(path);
      EXPECT_EQ(path.find("/bound/"), std::string::npos);
    }
    EXPECT_EQ(folders, (std::set<std::string>{"tree", "tree/b", "tree/plain", "tree/plain/inside",
                                              "a of tree", "a of tree/below"}));
    EXPECT_EQ(table->entries(), 7U);
    std::string differ;
    ASSERT_TRUE(nas::CompareTable(*table, {}, true, roots, [&](const nas::TableDifference& each) {
      differ += each.path + "\n";
    }));
    EXPECT_EQ(differ, "");
  }));
}

// What no small tree has.
TEST_F(Table, HoldsNumbersOfEverySize) {
  struct Case {
    const char* name;
    std::uint64_t inode;
    std::uint64_t size;
  };
  const std::vector<Case> cases = {{"a", 1, 0},
                                   {"b", UINT32_MAX, UINT32_MAX - 1ULL},
                                   {"c", 1ULL << 32, UINT32_MAX},
                                   {"d", UINT64_MAX, 1ULL << 62},
                                   {"e", 2, 5}};
  nas::ClassTable classes;
  nas::TableWriter writer;
  writer.AddTop("tree", {.inode = 1, .stamp = {}, .unreadable = false, .key = "key"});
  for (const Case& test : cases) {
    const nas::TableClass row{S_IFREG, static_cast<std::uint32_t>(test.inode), 0};
    writer.AddEntry(test.name, test.name,
                    {.inode = test.inode, .size = test.size, .row = classes.Number(row)});
  }
  // More owners than there are rows: known no more.
  for (std::uint32_t owner = 0; owner < 70'000; ++owner) {
    const std::string name = "f" + std::to_string(100'000 + owner);
    writer.AddEntry(name, name, {.inode = owner, .row = classes.Number({S_IFREG, owner, 1})});
  }
  ASSERT_TRUE(writer.Write(table_folder_.get(), "names", kFileSystem, classes.Rows()));
  const auto table = Open("names");
  ASSERT_TRUE(table);
  for (const Case& test : cases) {
    SCOPED_TRACE(test.name);
    const auto id = table->FindEntry(0, test.name);
    ASSERT_LT(id, table->entries());
    EXPECT_EQ(table->inode(id), test.inode);
    EXPECT_EQ(table->attributes(id)->size, test.size);
    EXPECT_EQ(table->attributes(id)->uid, static_cast<std::uint32_t>(test.inode));
  }
  size_t known = 0;
  for (nas::NameTable::EntryId id = 0; id < table->entries(); ++id) {
    EXPECT_EQ(table->type(id), DT_REG);
    known += table->attributes(id) ? 1 : 0;
  }
  // A row for each, but for two of the cases that have the same.
  EXPECT_EQ(known, 65'536U - nas::kTypeClasses + 1);
}

// Times that do not fit are not told wrong, and a stamp that a change may share is none.
TEST_F(Table, IsSilentWhereTimesSayNothing) {
  for (const char* name : {"old", "far", "fits"}) WriteFile(Path(name), "");
  const auto touch = [&](const char* name, std::int64_t seconds) {
    const timespec times[] = {{seconds, 0}, {seconds, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, Path(name).c_str(), times, 0), 0);
  };
  touch("old", -(1LL << 31) + 1);
  touch("far", 1LL << 33);
  touch("fits", INT32_MAX);
  LetStampsSettle();
  const nas::NameTable table = Scan();
  const auto mtime = [&](const char* name) {
    const auto attributes = table.attributes(table.FindEntry(0, name));
    return attributes ? std::to_string(attributes->mtime) : "unknown";
  };
  struct stat far;
  ASSERT_EQ(lstat(Path("far").c_str(), &far), 0);
  EXPECT_EQ(mtime("far"), far.st_mtime > INT32_MAX ? "unknown" : std::to_string(far.st_mtime));
  EXPECT_EQ(mtime("old"), std::to_string(-(1LL << 31) + 1));
  EXPECT_EQ(mtime("fits"), std::to_string(INT32_MAX));
  EXPECT_TRUE(table.stamp(0));
  EXPECT_TRUE(nas::SweepFolders(table, Roots())->empty());
}

// A second change within one step of the clock would leave the stamp as it is.
TEST_F(Table, HasNoStampOfAFolderThatHasJustChanged) {
  const std::string fresh = Path("fresh");
  fs::create_directory(fresh);
  fs::create_directory(Path("later"));
  LetStampsSettle();
  const auto age = [&] {
    struct stat status;
    EXPECT_EQ(lstat(fresh.c_str(), &status), 0);
    timespec now;
    clock_gettime(CLOCK_REALTIME, &now);
    return std::chrono::seconds(now.tv_sec - status.st_ctim.tv_sec) +
           std::chrono::nanoseconds(now.tv_nsec - status.st_ctim.tv_nsec);
  };
  std::chrono::nanoseconds age_after{};
  nas::ScanOptions options;
  options.threads = 1;
  const std::string key = KeyAt(fresh);
  options.before_reading = [&](int, const nas::FolderKey& read) {
    if (read == key) chmod(fresh.c_str(), 0755);
    if (read == KeyAt(Path("later"))) age_after = age();
  };
  // Where the machine was too slow to tell, once more.
  EXPECT_TRUE(nas_test::Eventually([&] {
    const nas::NameTable table = Scan("names", options);
    if (age_after >= std::chrono::milliseconds(20)) return false;
    EXPECT_FALSE(table.stamp(table.Find(key)));
    EXPECT_TRUE(table.stamp(table.Find(KeyAt(Path("later")))));
    const auto swept = nas::SweepFolders(table, Roots());
    EXPECT_EQ(*swept, std::vector<FolderId>{table.Find(key)});
    return true;
  }));
}

// Whoever asks about a folder finds it by its key, wherever it has gone.
TEST_F(Table, DoesNotBelieveWhatHasMovedAway) {
  fs::create_directories(Path("moved/below"));
  fs::create_directory(Path("stays"));
  LetStampsSettle();
  const nas::NameTable table = Scan();
  fs::rename(Path("moved"), Path("stays/elsewhere"));
  WriteFile(Path("stays/elsewhere/below/new"), "");
  const auto swept = nas::SweepFolders(table, Roots());
  ASSERT_TRUE(swept);
  for (const char* folder : {"stays/elsewhere", "stays/elsewhere/below", "stays"}) {
    const FolderId id = table.Find(KeyAt(Path(folder)));
    EXPECT_NE(std::ranges::find(*swept, id), swept->end()) << folder;
  }
}

}  // namespace
}  // namespace index_test
