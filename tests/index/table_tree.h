#pragma once
// Trees for the tests of name tables, and what a table and the file system say of them in one form,
// read in two ways.

#include <gtest/gtest.h>

#include <map>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "nas/base/unique_fd.h"
#include "nas/index/changes.h"
#include "nas/index/name_table.h"
#include "nas/index/tree_scan.h"
#include "tests/nas/fixture.h"

namespace index_test {

inline constexpr char kFileSystem[] = "the test's own";

// What is known of each path: its type, inode and attributes, and what of a folder.
using Picture = std::map<std::string, std::string>;

Picture PictureOf(const nas::NameTable& table);
// By lstat and readdir alone. Entries in `closed` folders are not known.
Picture PictureOf(const std::string& root);

class TableTest : public nas_test::PlatformTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  std::string Path(const std::string& below) const { return tree_ + "/" + below; }
  std::vector<nas::TableRoot> Roots() const { return {{root_.get(), "tree"}}; }
  nas::TablePlace Place(const std::string& name) const;
  nas::Result<nas::NameTable> Open(const std::string& name) const;
  // A table of the tree, made now.
  nas::NameTable Scan(const std::string& name = "names",
                      const nas::ScanOptions& options = {}) const;
  nas::NameTable Merge(const nas::NameTable& old, const nas::Changes& changes) const;
  // What events would have said: this name, and that its folder has changed.
  static void Note(const nas::NameTable& table, const std::string& path, nas::Changes& changes);
  // The differences that a check tells, one a line.
  std::string Differences(const nas::NameTable& table, const nas::Changes& changes = {}) const;

  std::string tree_;
  std::string tables_;
  nas::UniqueFd root_;
  nas::UniqueFd table_folder_;
};

// Makes, changes and removes files and folders below one, with names of every kind.
class RandomTree {
 public:
  RandomTree(std::string root, unsigned seed) : root_(std::move(root)), random_(seed) {}
  // Does something and returns the paths below the root that it touched.
  std::vector<std::string> Step();

 private:
  std::string Name();
  std::string Any(bool folder);
  size_t Below(size_t count) { return random_() % count; }

  std::string root_;
  std::mt19937 random_;
};

}  // namespace index_test
