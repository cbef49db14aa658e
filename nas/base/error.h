#pragma once
// The last platform error of this process. Every platform operation that fails sets it once, at the
// place that knows the cause; NLIBCErrGet and WfmLibGetErr read it.

namespace nas {

enum PlatformError : int {
  kErrorNone = 0,
  kErrorOther = 0x0100,
  kErrorIo = 0x0200,
  kErrorPermission = 0x0300,
  kErrorNoSpace = 0x0400,
  kErrorDatabase = 0x0500,
  kErrorNoSuchFolder = 0x0600,
  kErrorUnknownUser = 0x1800,
  kErrorUnknownGroup = 0x1D00,
  kErrorIllegal = 0x9A00,
};

// Both leave errno as it is. Callable from any thread; the last writer wins.
void SetLastError(PlatformError error);
PlatformError ErrorFromErrno(int error_number);

}  // namespace nas
