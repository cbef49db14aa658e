// Failures as values, the last platform error number, and its translation into web API codes.

#include "nas/base/error.h"

#include <atomic>
#include <cerrno>
#include <cstring>

#include "platform/system.h"
#include "platform/webfm.h"

namespace nas {
namespace {

std::atomic<int> g_last_error{kErrorNone};

}  // namespace

void SetLastError(PlatformError error) { g_last_error.store(error, std::memory_order_relaxed); }

PlatformError ErrorFromErrno(int error_number) {
  switch (error_number) {
    case EACCES:
    case EPERM:
    case EROFS:
      return kErrorPermission;
    case ENOENT:
    case ENOTDIR:
      return kErrorNoSuchFolder;
    case ENOSPC:
    case EDQUOT:
      return kErrorNoSpace;
    case EXDEV:  // what openat2 says of a path that leaves its share
    case ELOOP:
    case ENAMETOOLONG:
    case EINVAL:
      return kErrorIllegal;
    case EIO:
      return kErrorIo;
    default:
      return kErrorOther;
  }
}

std::string Error::Text() const {
  const char* meaning = error_number != 0 ? std::strerror(error_number) : "failed";
  return path.empty() ? meaning : path + ": " + meaning;
}

Error ErrnoError(std::string path) { return ErrnoError(errno, std::move(path)); }

Error ErrnoError(int error_number, std::string path) {
  return {ErrorFromErrno(error_number), error_number, std::move(path)};
}

void Report(const Error& error) {
  SetLastError(error.kind);
  errno = error.error_number;
}

}  // namespace nas

int NLIBCErrGet() { return nas::g_last_error.load(std::memory_order_relaxed); }

int WfmLibGetErr() { return WfmParseErrnoToError(NLIBCErrGet(), nullptr, nullptr); }

int WfmParseErrnoToError(int error, const char* /*path*/, const char* /*other_path*/) {
  switch (error) {
    case nas::kErrorPermission:
      return web_code::kPermission;
    case nas::kErrorNoSuchFolder:
      return web_code::kNoSuchFolder;
    case nas::kErrorUnknownUser:
    case nas::kErrorUnknownGroup:
      return web_code::kNoSuchAccount;
    case nas::kErrorIllegal:
      return web_code::kIllegal;
    default:
      return web_code::kFailed;
  }
}
