#pragma once
// Failures inside the platform are values: what kind, which errno, and of which path. A function
// that can fail returns a Result (or a Status, where it has nothing else to tell) and sets neither
// errno nor the last platform error for its caller to find; where an operation of platform/ ends,
// and only there, Report turns the value into the number that NLIBCErrGet tells.

#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "platform/errors.h"

namespace nas {

enum PlatformError : int {
  kErrorNone = 0,
  kErrorOther = 0x0100,
  kErrorIo = 0x0200,
  kErrorPermission = platform_error::kPermission,
  kErrorNoSpace = 0x0400,
  kErrorDatabase = 0x0500,
  kErrorNoSuchFolder = platform_error::kNoSuchFolder,
  kErrorUnknownUser = platform_error::kNoSuchUser,
  kErrorUnknownGroup = platform_error::kNoSuchGroup,
  kErrorIllegal = platform_error::kIllegal,
};

struct Error {
  PlatformError kind = kErrorOther;
  int error_number = 0;   // errno of the system call that failed, or the nearest one
  std::string path = {};  // what it is about; may be empty

  // For logs and messages: "PATH: what errno means".
  std::string Text() const;
  // The same failure, told of another path.
  Error Of(std::string other_path) const { return {kind, error_number, std::move(other_path)}; }
};

PlatformError ErrorFromErrno(int error_number);
// The failure of the system call just made; the kind follows from errno.
Error ErrnoError(std::string path = {});
Error ErrnoError(int error_number, std::string path = {});

// A value or the reason why there is none. Like std::optional to use: test it, then dereference.
template <typename T>
class [[nodiscard]] Result {
 public:
  // Not explicit, so that a function returns its value or its error as it is.
  Result(T value) : held_(std::move(value)) {}
  Result(Error error) : held_(std::move(error)) {}

  bool ok() const { return held_.index() == 0; }
  explicit operator bool() const { return ok(); }
  // Of one that is ok; otherwise they throw std::bad_variant_access.
  T& operator*() { return std::get<0>(held_); }
  const T& operator*() const { return std::get<0>(held_); }
  T* operator->() { return &std::get<0>(held_); }
  const T* operator->() const { return &std::get<0>(held_); }
  T value_or(T other) && { return ok() ? std::move(**this) : std::move(other); }
  // Of one that is not ok.
  const Error& error() const { return std::get<1>(held_); }

 private:
  std::variant<T, Error> held_;
};

// Success, or the reason why not.
class [[nodiscard]] Status {
 public:
  Status() = default;
  Status(Error error) : error_(std::move(error)) {}

  bool ok() const { return !error_; }
  explicit operator bool() const { return ok(); }
  const Error& error() const { return *error_; }

 private:
  std::optional<Error> error_;
};

// The last platform error of this process, which NLIBCErrGet and WfmLibGetErr read. For operations
// of platform/ that fail, each once, at its end. Callable from any thread; the last writer wins.
// SetLastError leaves errno as it is, Report sets it too.
void SetLastError(PlatformError error);
void Report(const Error& error);

}  // namespace nas
