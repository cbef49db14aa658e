#pragma once
// Reads a directory with getdents64 and a large buffer: one system call for most folders.

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>

namespace nas {

// For one thread at a time. Allocates its buffer (128 KiB) once and nothing for an entry.
class DirectoryReader {
 public:
  struct Entry {
    std::string_view name;  // NUL-ended, into the buffer
    ino_t inode = 0;
    unsigned char type =
        0;  // DT_*; looked up where the directory does not tell, DT_UNKNOWN where that fails
  };

  DirectoryReader();

  // Begins with the directory open at `fd`, which is borrowed until the last entry.
  void Start(int fd);
  // The next entry but "." and "..". False at the end, and on failure with failed() set to errno.
  bool Next(Entry& entry);
  int failed() const { return failed_; }

 private:
  bool Fill();

  std::unique_ptr<char[]> buffer_;
  int fd_ = -1;
  size_t at_ = 0;
  size_t filled_ = 0;
  int failed_ = 0;
};

}  // namespace nas
