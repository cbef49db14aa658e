#include "nas/base/spool.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

#include "nas/base/file_io.h"
#include "nas/base/system_call.h"

namespace nas {
namespace {

constexpr size_t kCopyBytes = size_t{256} << 10;

}  // namespace

Spool::Spool(const std::string& folder)
    : fd_(open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, S_IRUSR | S_IWUSR)) {}

bool Spool::Append(std::string_view bytes) {
  if (!fd_) return false;
  if (WriteAll(fd_.get(), bytes)) {
    bytes_ += bytes.size();
    return true;
  }
  // The next bytes come after those that were kept.
  (void)lseek(fd_.get(), static_cast<off_t>(bytes_), SEEK_SET);
  // What cannot be cut off is overwritten, or never read.
  [[maybe_unused]] const int cut = ftruncate(fd_.get(), static_cast<off_t>(bytes_));
  return false;
}

bool Spool::CopyTo(int fd) const {
  std::string buffer(kCopyBytes, '\0');
  for (std::uint64_t done = 0; done < bytes_;) {
    const size_t wanted = std::min<std::uint64_t>(bytes_ - done, buffer.size());
    const ssize_t count = Uninterrupted(
        [&] { return pread(fd_.get(), buffer.data(), wanted, static_cast<off_t>(done)); });
    if (count <= 0) return false;
    if (!WriteAll(fd, std::string_view(buffer).substr(0, static_cast<size_t>(count)))) return false;
    done += static_cast<std::uint64_t>(count);
  }
  return true;
}

}  // namespace nas
