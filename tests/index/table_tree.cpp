#include "tests/index/table_tree.h"

#include <dirent.h>

#include <algorithm>
#include <sstream>

#include "nas/index/table_compare.h"

namespace index_test {

namespace fs = std::filesystem;

namespace {

std::string Line(unsigned type, std::uint64_t inode, const nas::NameTable::Attributes* attributes) {
  std::ostringstream line;
  line << "type " << type << " inode " << inode;
  if (attributes == nullptr) return line.str() + " unknown";
  line << " size " << attributes->size << " mtime " << attributes->mtime << " crtime "
       << attributes->crtime << " mode " << std::oct << attributes->mode << std::dec << " owner "
       << attributes->uid << ":" << attributes->gid;
  return line.str();
}

void AddFolder(const nas::NameTable& table, nas::NameTable::FolderId folder,
               const std::string& path, Picture& picture) {
  picture[path] += table.unreadable(folder) ? " unreadable" : " folder";
  for (auto id = table.entries_begin(folder); id < table.entries_end(folder); ++id) {
    const std::string below = path + "/" + std::string(table.name(id));
    const auto attributes = table.attributes(id);
    picture[below] = Line(table.type(id), table.inode(id), attributes ? &*attributes : nullptr);
    const auto child = table.folder_at(id);
    if (child != nas::NameTable::kNoFolder) AddFolder(table, child, below, picture);
  }
}

void AddFolder(const std::string& path, const std::string& told, Picture& picture) {
  picture[told] += " folder";
  DIR* folder = opendir(path.c_str());
  if (folder == nullptr) return;
  while (const dirent* entry = readdir(folder)) {
    const std::string name = entry->d_name;
    if (name == "." || name == "..") continue;
    struct statx status;
    const std::string below = path + "/" + name;
    if (statx(AT_FDCWD, below.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME,
              &status) != 0) {
      continue;
    }
    const bool is_folder = S_ISDIR(status.stx_mode);
    const nas::NameTable::Attributes attributes{.size = status.stx_size,
                                                .mtime = status.stx_mtime.tv_sec,
                                                .crtime = status.stx_btime.tv_sec,
                                                .mode = status.stx_mode,
                                                .uid = status.stx_uid,
                                                .gid = status.stx_gid};
    const bool known = is_folder || status.stx_nlink == 1;
    picture[told + "/" + name] =
        Line(IFTODT(status.stx_mode), status.stx_ino, known ? &attributes : nullptr);
    if (is_folder) AddFolder(below, told + "/" + name, picture);
  }
  closedir(folder);
}

}  // namespace

Picture PictureOf(const nas::NameTable& table) {
  Picture picture;
  for (size_t tree = 0; tree < table.trees(); ++tree) {
    AddFolder(table, table.top(tree), std::string(table.top_name(tree)), picture);
  }
  return picture;
}

Picture PictureOf(const std::string& root) {
  Picture picture;
  AddFolder(root, "tree", picture);
  return picture;
}

void TableTest::SetUp() {
  PlatformTest::SetUp();
  tree_ = MakeFolder("tree");
  tables_ = MakeFolder("tables");
  root_ = nas::UniqueFd(open(tree_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  table_folder_ = nas::UniqueFd(open(tables_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

void TableTest::TearDown() {
  root_.Reset();
  table_folder_.Reset();
  PlatformTest::TearDown();
}

nas::TablePlace TableTest::Place(const std::string& name) const {
  return {table_folder_.get(), name, kFileSystem};
}

nas::Result<nas::NameTable> TableTest::Open(const std::string& name) const {
  return nas::NameTable::Open(table_folder_.get(), name, kFileSystem);
}

nas::NameTable TableTest::Scan(const std::string& name, const nas::ScanOptions& options) const {
  const nas::Status made = nas::ScanTree(Roots(), Place(name), options);
  EXPECT_TRUE(made) << (made ? "" : made.error().Text());
  auto table = Open(name);
  EXPECT_TRUE(table) << table.error().Text();
  return std::move(*table);
}

nas::NameTable TableTest::Merge(const nas::NameTable& old, const nas::Changes& changes) const {
  const nas::Status made = nas::MergeTable(old, changes, false, Roots(), Place("merged"));
  EXPECT_TRUE(made) << (made ? "" : made.error().Text());
  auto table = Open("merged");
  EXPECT_TRUE(table) << table.error().Text();
  return std::move(*table);
}

void TableTest::Note(const nas::NameTable& table, const std::string& path, nas::Changes& changes) {
  auto folder = table.top(0);
  std::istringstream names(path);
  for (std::string name; std::getline(names, name, '/');) {
    // Each of them: a hint too many does no harm, and the rows of all folders on the way are right.
    changes.AddName(folder, name);
    const auto id = table.FindEntry(folder, name);
    folder = id == table.entries() ? nas::NameTable::kNoFolder : table.folder_at(id);
    if (folder == nas::NameTable::kNoFolder) return;
  }
}

std::string TableTest::Differences(const nas::NameTable& table, const nas::Changes& changes) const {
  std::string all;
  const auto told = [&](const nas::TableDifference& difference) {
    all += std::to_string(static_cast<int>(difference.kind)) + " " + difference.path + "\n";
  };
  const nas::Status done = nas::CompareTable(table, changes, true, Roots(), told);
  EXPECT_TRUE(done) << (done ? "" : done.error().Text());
  return all;
}

std::string RandomTree::Name() {
  static const std::vector<std::string> kNames = {"a",
                                                  "B",
                                                  "report.TXT",
                                                  "two\nlines",
                                                  "\xff\xfe broken",
                                                  "\u00dcbersicht",
                                                  "U\u0308bersicht",
                                                  "stra\u00dfe",
                                                  "\u65e5\u672c\u8a9e",
                                                  std::string(255, 'x'),
                                                  "\1",
                                                  "-",
                                                  " ",
                                                  "\u0130",
                                                  "na\u00efve.JPG",
                                                  "name.with.dots",
                                                  "tab\there",
                                                  std::string(127, 'A') + "\u00e9"};
  std::string name = kNames[Below(kNames.size())];
  constexpr size_t kLongest = 255;
  if (Below(2) == 0) name += std::to_string(Below(10));
  return name.size() <= kLongest ? name : name.substr(0, kLongest);
}

// A path below the root; a folder may be the root itself (empty).
std::string RandomTree::Any(bool folder) {
  std::vector<std::string> all;
  if (folder) all.emplace_back();
  for (const auto& entry : fs::recursive_directory_iterator(root_)) {
    if (!folder || (entry.is_directory() && !entry.is_symlink())) {
      all.push_back(entry.path().string().substr(root_.size() + 1));
    }
  }
  return all.empty() ? "" : all[Below(all.size())];
}

// Neither waits for a named pipe nor goes where a link leads.
void WriteHere(const std::string& path, size_t bytes) {
  const nas::UniqueFd fd(
      open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0644));
  if (fd && ftruncate(fd.get(), static_cast<off_t>(bytes)) != 0) return;
}

std::vector<std::string> RandomTree::Step() {
  const auto inside = [](const std::string& folder, const std::string& name) {
    return folder.empty() ? name : folder + "/" + name;
  };
  const std::string fresh = inside(Any(true), Name());
  const std::string old = Any(false);
  const std::string from = root_ + "/" + old;
  const std::string to = root_ + "/" + fresh;
  std::error_code ignored;
  switch (Below(12)) {
    case 0:
    case 1:
      mkdir(to.c_str(), 0755);
      return {fresh};
    case 2:
    case 3:
    case 4:
      WriteHere(to, Below(100));
      return {fresh};
    case 5:
      if (symlink("nowhere", to.c_str()) != 0) return {};
      return {fresh};
    case 6:
      if (mkfifo(to.c_str(), 0600) != 0) return {};
      return {fresh};
    case 7:
      if (old.empty() || link(from.c_str(), to.c_str()) != 0) return {};
      return {fresh, old};
    case 8:
    case 9:
      if (old.empty() || rename(from.c_str(), to.c_str()) != 0) return {};
      return {old, fresh};
    case 10:
      if (!old.empty()) fs::remove_all(from, ignored);
      return {old};
    default:
      if (old.empty() || fs::is_symlink(from)) return {};
      chmod(from.c_str(), Below(2) == 0 ? 0700 : 0755);
      return {old};
  }
}

}  // namespace index_test
