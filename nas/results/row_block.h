#pragma once
// A block of result rows on its way into a result database, in the layout of result_file.h. For one
// thread at a time.

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/results/result_file.h"

namespace nas {

class RowBlock {
 public:
  // Rows in a block at most: some 150 KB, small enough to read for one row of a page, large enough
  // that storing a block costs little beside finding its rows.
  static constexpr size_t kMostRows = 2048;

  // Says where the rows that follow lie: `path` below the share's root of location `location`.
  void SetFolder(std::uint16_t location, std::string_view path);
  // Copies what it is given; the copy's `folder` is set here. Names, as paths, hold no NUL.
  void Add(std::string_view name, const FileAttributes& attributes);

  // Takes rows that another process has found, all of them of one location and at or below `path`
  // in its share: the three sides of a block, whose own numbers of locations do not count. False,
  // with the block empty, for what is no block.
  bool Assign(std::uint16_t location, std::string_view path, std::string_view folders,
              std::string_view names, std::string_view attributes);

  // Calls `tell` with each folder's path and the NUL-ended names that follow each other in it.
  void EachFolder(
      const std::function<void(std::string_view path, std::string_view names)>& tell) const;

  // Of what is taken from another process: whether the path is that of the folder or of one below
  // it, and how many NUL-ended names of entries there are; nothing where they are not that.
  static bool IsAtOrBelow(std::string_view path, std::string_view folder);
  static std::optional<size_t> CountNames(std::string_view names);

  size_t size() const { return attributes_.size(); }
  bool full() const { return size() >= kMostRows; }
  // Drops the rows; the folder set last holds for those that follow.
  void Clear();

  // The three sides as they are stored; valid until the block changes.
  std::string_view folders() const { return folders_; }
  std::string_view names() const { return names_; }
  std::string_view attributes() const {
    return {reinterpret_cast<const char*>(attributes_.data()),
            attributes_.size() * sizeof(FileAttributes)};
  }

 private:
  std::vector<FileAttributes> attributes_;
  std::string names_;
  std::string folders_;
  std::uint32_t folder_count_ = 0;
  // The folder set last, kept over Clear and written to `folders_` with its first row.
  std::uint16_t location_ = 0;
  std::string path_;
  bool folder_written_ = false;
};

}  // namespace nas
