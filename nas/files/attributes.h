#pragma once
// What the file system knows of a file beside its name.

#include <cstdint>

#include "nas/base/error.h"

namespace nas {

// The attributes that are stored with a result and asked by criteria. Times in seconds since the
// epoch. Also the layout of a row's attributes in a result database (result_file.h).
struct FileAttributes {
  // Creation time of a file on a file system that does not record it.
  static constexpr std::int64_t kNoTime = INT64_MIN;

  std::uint64_t size = 0;
  std::int64_t atime = 0;
  std::int64_t mtime = 0;
  std::int64_t ctime = 0;
  std::int64_t crtime = kNoTime;
  std::uint32_t mode = 0;  // type and permission bits, as in stat(2)
  std::uint32_t uid = 0;
  std::uint32_t gid = 0;
  // In a stored row: index into its block's folders.
  std::uint32_t folder = 0;
};
static_assert(sizeof(FileAttributes) == 56, "the layout of a stored row, without gaps");

// Of `name` in the folder open at `folder` (O_PATH will do), itself where it is a symbolic link.
// One system call; a file server is not asked anew for what the kernel holds. The error names no
// path, so that failing costs no memory.
Result<FileAttributes> ReadAttributes(int folder, const char* name);

// Only the type, as DT_*; DT_UNKNOWN where it cannot be had.
unsigned char ReadType(int folder, const char* name);

}  // namespace nas
