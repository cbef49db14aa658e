#include "nas/base/file_io.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "nas/base/random_name.h"
#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"

namespace nas {
namespace {

constexpr size_t kReadBytes = size_t{64} << 10;

bool IsReadable(const UniqueFd& fd, size_t max_bytes, size_t* size) {
  struct stat info;
  if (fstat(fd.get(), &info) != 0) return false;
  if (!S_ISREG(info.st_mode)) {
    errno = S_ISDIR(info.st_mode) ? EISDIR : EINVAL;
    return false;
  }
  *size = static_cast<size_t>(info.st_size);
  if (*size > max_bytes) errno = EFBIG;
  return *size <= max_bytes;
}

bool FillNew(int dir_fd, const char* name, std::string_view bytes, mode_t mode, bool durable) {
  const UniqueFd fd(openat(dir_fd, name, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                           S_IRUSR | S_IWUSR));
  if (!fd) return false;
  if (!WriteAll(fd.get(), bytes)) return false;
  if (mode != (S_IRUSR | S_IWUSR) && fchmod(fd.get(), mode) != 0) return false;
  return !durable || fdatasync(fd.get()) == 0;
}

std::string NameBeside(std::string_view name) {
  const size_t slash = name.rfind('/');
  std::string fresh(name.substr(0, slash == std::string_view::npos ? 0 : slash + 1));
  fresh += kTemporaryPrefix;
  return fresh + RandomName();
}

void RemoveQuietly(int dir_fd, const std::string& name) {
  const int saved = errno;
  unlinkat(dir_fd, name.c_str(), 0);
  errno = saved;
}

}  // namespace

bool WriteAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = Uninterrupted([&] { return write(fd, bytes.data(), bytes.size()); });
    if (count < 0) return false;
    bytes.remove_prefix(static_cast<size_t>(count));
  }
  return true;
}

bool ReadWholeFile(int dir_fd, const char* name, size_t max_bytes, std::string* bytes) {
  // Not blocking: a named pipe in the file's place must not hold the process up.
  const UniqueFd fd(openat(dir_fd, name, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  size_t size = 0;
  if (!fd || !IsReadable(fd, max_bytes, &size)) return false;
  std::string content;
  // One byte more than the size, so that the end is seen without another round.
  size_t room = size + 1;
  for (;;) {
    const size_t used = content.size();
    content.resize(used + room);
    const ssize_t count =
        Uninterrupted([&] { return read(fd.get(), content.data() + used, room); });
    content.resize(used + static_cast<size_t>(std::max<ssize_t>(count, 0)));
    if (count < 0) return false;
    if (count == 0) break;
    if (content.size() > max_bytes) {
      errno = EFBIG;
      return false;
    }
    room = kReadBytes;
  }
  *bytes = std::move(content);
  return true;
}

bool ReplaceFile(int dir_fd, const char* name, std::string_view bytes, mode_t mode, bool durable) {
  const std::string fresh = NameBeside(name);
  if (FillNew(dir_fd, fresh.c_str(), bytes, mode, durable) &&
      renameat(dir_fd, fresh.c_str(), dir_fd, name) == 0) {
    return true;
  }
  RemoveQuietly(dir_fd, fresh);
  return false;
}

bool CreateFile(int dir_fd, const char* name, std::string_view bytes, mode_t mode) {
  const std::string fresh = NameBeside(name);
  const bool made = FillNew(dir_fd, fresh.c_str(), bytes, mode, /*durable=*/false) &&
                    linkat(dir_fd, fresh.c_str(), dir_fd, name, 0) == 0;
  RemoveQuietly(dir_fd, fresh);
  return made;
}

}  // namespace nas
