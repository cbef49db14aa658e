#include "nas/files/directory_reader.h"

#include <dirent.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "nas/base/system_call.h"
#include "nas/files/attributes.h"

namespace nas {
namespace {

// Holds some 4,000 entries of common length. Larger buffers gain nothing and fall out of the cache.
constexpr size_t kBufferBytes = 128 * 1024;

}  // namespace

DirectoryReader::DirectoryReader() : buffer_(std::make_unique<char[]>(kBufferBytes)) {}

void DirectoryReader::Start(int fd) {
  fd_ = fd;
  at_ = filled_ = 0;
  failed_ = 0;
}

bool DirectoryReader::Fill() {
  const long count =
      Uninterrupted([this] { return syscall(SYS_getdents64, fd_, buffer_.get(), kBufferBytes); });
  at_ = 0;
  filled_ = count > 0 ? static_cast<size_t>(count) : 0;
  if (count < 0) failed_ = errno;
  return count > 0;
}

bool DirectoryReader::Next(Entry& entry) {
  for (;;) {
    if (at_ == filled_ && !Fill()) return false;
    const auto* record = reinterpret_cast<const dirent64*>(buffer_.get() + at_);
    at_ += record->d_reclen;
    entry.name = record->d_name;
    if (entry.name == "." || entry.name == "..") continue;
    entry.inode = record->d_ino;
    entry.type = record->d_type;
    if (entry.type == DT_UNKNOWN) entry.type = ReadType(fd_, record->d_name);
    return true;
  }
}

}  // namespace nas
