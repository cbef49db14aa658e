#pragma once
// The numbers of failures that pass between the platform, its modules and their clients.

// Why an operation of the platform failed, as NLIBCErrGet tells it. There are others, which no
// module tells apart: input and output, space, databases.
namespace platform_error {

inline constexpr int kPermission = 0x0300;
inline constexpr int kNoSuchFolder = 0x0600;
inline constexpr int kNoSuchUser = 0x1800;
inline constexpr int kNoSuchGroup = 0x1D00;
inline constexpr int kIllegal = 0x9A00;  // a path or a criterion

}  // namespace platform_error

// The same as clients know it, in replies and in "errno" of a failed search's record.
namespace web_code {

inline constexpr int kFailed = 401;  // whatever has no code of its own
inline constexpr int kNoSuchAccount = 405;
inline constexpr int kPermission = 407;
inline constexpr int kNoSuchFolder = 408;
inline constexpr int kIllegal = 418;

}  // namespace web_code
