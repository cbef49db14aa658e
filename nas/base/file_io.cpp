#include "nas/base/file_io.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <ctime>

#include "nas/base/keeping.h"
#include "nas/base/paths.h"
#include "nas/base/random_name.h"
#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"

namespace nas {
namespace {

// Room to look for an end that should have come: small, as what is made room for is also cleared.
constexpr size_t kLeastRoom = 512;
constexpr mode_t kPrivateMode = S_IRUSR | S_IWUSR;

// The size of what may be read, or errno of why it may not.
Result<size_t> ReadableSize(int fd, size_t max_bytes) {
  struct stat info;
  if (fstat(fd, &info) != 0) return ErrnoError();
  if (!S_ISREG(info.st_mode)) return ErrnoError(S_ISDIR(info.st_mode) ? EISDIR : EINVAL);
  const auto size = static_cast<size_t>(info.st_size);
  if (size > max_bytes) return ErrnoError(EFBIG);
  return size;
}

Result<std::string> ReadToEnd(int fd, size_t max_bytes) {
  const auto size = ReadableSize(fd, max_bytes);
  if (!size) return size.error();
  std::string content;
  // One byte more than the size, so that the end is seen without another round.
  size_t room = *size + 1;
  for (;;) {
    const size_t used = content.size();
    content.resize(used + room);
    const ssize_t count = Uninterrupted([&] { return read(fd, content.data() + used, room); });
    if (count < 0) return ErrnoError();
    content.resize(used + static_cast<size_t>(count));
    if (count == 0) return content;
    if (content.size() > max_bytes) return ErrnoError(EFBIG);
    room = std::max(kLeastRoom, content.size());
  }
}

Status FillNew(int dir_fd, const std::string& name, std::string_view bytes, mode_t mode,
               Durability durability) {
  constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  const UniqueFd fd(openat(dir_fd, name.c_str(), kFlags, kPrivateMode));
  if (!fd) return ErrnoError();
  if (Status written = WriteAll(fd.get(), bytes); !written) return written;
  if (mode != kPrivateMode && fchmod(fd.get(), mode) != 0) return ErrnoError();
  if (durability != Durability::kNone && fdatasync(fd.get()) != 0) return ErrnoError();
  return {};
}

// With a final "/"; empty for a name without a folder.
std::string_view FolderPart(std::string_view name) { return name.substr(0, name.rfind('/') + 1); }

std::string FolderOf(std::string_view name) {
  const std::string_view folder = FolderPart(name);
  return folder.empty() ? "." : std::string(folder);
}

std::string NameBeside(std::string_view name) {
  return std::string(FolderPart(name)).append(kTemporaryPrefix) + RandomName();
}

}  // namespace

Status WriteAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = Uninterrupted([&] { return write(fd, bytes.data(), bytes.size()); });
    if (count < 0) return ErrnoError();
    bytes.remove_prefix(static_cast<size_t>(count));
  }
  return {};
}

Result<std::string> ReadWholeFile(int dir_fd, const std::string& name, size_t max_bytes) {
  // Not blocking: a named pipe in the file's place must not hold the process up.
  constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
  const UniqueFd fd(openat(dir_fd, name.c_str(), kFlags));
  if (!fd) return ErrnoError(name);
  auto content = ReadToEnd(fd.get(), max_bytes);
  if (!content) return content.error().Of(name);
  return content;
}

Status ReplaceFile(int dir_fd, const std::string& name, std::string_view bytes, mode_t mode,
                   Durability durability) {
  const std::string fresh = NameBeside(name);
  Status done = FillNew(dir_fd, fresh, bytes, mode, durability);
  if (done && renameat(dir_fd, fresh.c_str(), dir_fd, name.c_str()) != 0) done = ErrnoError();
  if (!done) unlinkat(dir_fd, fresh.c_str(), 0);
  if (done && durability == Durability::kFull) done = SyncFolder(dir_fd, FolderOf(name));
  if (done) return done;
  return done.error().Of(name);
}

Status CreateFile(int dir_fd, const std::string& name, std::string_view bytes, mode_t mode) {
  const std::string fresh = NameBeside(name);
  Status done = FillNew(dir_fd, fresh, bytes, mode, Durability::kFull);
  if (done && linkat(dir_fd, fresh.c_str(), dir_fd, name.c_str(), 0) != 0) done = ErrnoError();
  unlinkat(dir_fd, fresh.c_str(), 0);
  if (done) done = SyncFolder(dir_fd, FolderOf(name));
  if (done) return done;
  return done.error().Of(name);
}

void SweepTemporaryFiles(const std::string& folder) {
  const time_t now = time(nullptr);
  for (const std::string& name : NamesIn(AT_FDCWD, folder).value_or({})) {
    struct stat info;
    const std::string path = folder + "/" + name;
    if (name.starts_with(kTemporaryPrefix) && lstat(path.c_str(), &info) == 0 &&
        now - info.st_mtime > kKeepSeconds) {
      unlink(path.c_str());
    }
  }
}

Status SyncFolder(int dir_fd, const std::string& name) {
  const UniqueFd folder(openat(dir_fd, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return folder && fsync(folder.get()) == 0 ? Status() : ErrnoError(name);
}

}  // namespace nas
