#include "platform/json_file.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "nas/base/file_io.h"
#include "nas/base/json_text.h"

namespace Json {
namespace {

// Settings are kilobytes; anything beyond this is not such a file and would only cost memory.
constexpr size_t kMaxFileBytes = size_t{16} << 20;
constexpr mode_t kNewFileMode = S_IRUSR | S_IWUSR;
constexpr mode_t kModeBits = 07777;

}  // namespace

bool fromFile(const std::string& path, Value& out) {
  const auto text = nas::ReadWholeFile(AT_FDCWD, path, kMaxFileBytes);
  const bool good = text && nas::ParseJson(*text, &out);
  if (!good) errno = text ? EBADMSG : text.error().error_number;
  return good;
}

// A settings file holds more than this system's counter, and a power cut must not empty it. That
// the counter may be short of the last searches then is worth no wait.
bool toFile(const std::string& path, const Value& value) {
  struct stat info;
  const bool exists = lstat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode);
  const mode_t mode = exists ? (info.st_mode & kModeBits) : kNewFileMode;
  std::string text = nas::JsonText(value, nas::JsonBytes::kRaw);
  text += '\n';
  const nas::Status replaced =
      nas::ReplaceFile(AT_FDCWD, path, text, mode, nas::Durability::kAtomic);
  if (!replaced) errno = replaced.error().error_number;
  return replaced.ok();
}

}  // namespace Json
