#include "platform/json_file.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "nas/base/file_io.h"
#include "nas/base/json_text.h"

namespace Json {
namespace {

// Settings are kilobytes; anything beyond this is not such a file and would only cost memory.
constexpr size_t kMaxFileBytes = size_t{256} << 20;
constexpr mode_t kNewFileMode = S_IRUSR | S_IWUSR;
constexpr mode_t kModeBits = 07777;

}  // namespace

bool fromFile(const std::string& path, Value& out) {
  std::string text;
  if (!nas::ReadWholeFile(AT_FDCWD, path.c_str(), kMaxFileBytes, &text)) return false;
  if (nas::ParseJson(text, &out)) return true;
  errno = EBADMSG;
  return false;
}

// Synced before it takes the old file's place: a settings file holds more than this system's
// counter, and a power cut must not empty it.
bool toFile(const std::string& path, const Value& value) {
  struct stat info;
  const bool exists = lstat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode);
  const mode_t mode = exists ? (info.st_mode & kModeBits) : kNewFileMode;
  std::string text = nas::JsonText(value, nas::JsonBytes::kRaw);
  text += '\n';
  return nas::ReplaceFile(AT_FDCWD, path.c_str(), text, mode, /*durable=*/true);
}

}  // namespace Json
