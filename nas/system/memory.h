#pragma once
// Bounds on what the calls of one user take of the machine's memory.
//
// A request child begins with a bound that suits every call but the listing of very many rows. Such
// a listing takes one of a few permits that its user has, which are locks on bytes of the file
// STATE/users/USER/tasks/large, and then goes on with a higher bound.

#include <cstdint>
#include <string>

#include "nas/base/error.h"

namespace nas {

// From now on allocations fail (std::bad_alloc) that would take the process's own writable memory,
// what it inherited included, over `bytes`; what it forks has the same bound. Not in builds with
// sanitizers, which map far more than they use.
void LimitMemory(std::uint64_t bytes);
// Takes the bound off again.
void LiftMemoryLimit();

// For a process that LimitMemory bounds: waits for one of the user's permits (large_calls_per_user)
// and raises the bound to that of large calls. EBUSY when none becomes free within kPermitTenths.
// The process holds it to its end, as it holds what it has made until its reply is sent; asking
// again costs nothing. Processes without a bound need none.
Status TakeLargePermit(const std::string& user);

// As long as a client may wait for the first byte of a large page behind others of the same user.
inline constexpr int kPermitTenths = 300;

}  // namespace nas
