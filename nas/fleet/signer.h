#pragma once
// Tokens for one user, from a process that has the front's secret key.
//
// Who asks boxes runs as the user, and must not have a key that speaks for everybody. So while the
// process still is what it was started as, a child of it reads the key, and from then on signs for
// this user alone, for the boxes of the configuration, whatever it is asked by the process and its
// forks; it ends with the last of them. Protocol, one message each way over a connection: "BOX HASH
// OFFSET", the offset that of the box's clock in seconds; then the token, or nothing where there is
// none.

#include <string>

#include "nas/base/error.h"
#include "nas/system/config.h"

namespace nas {

// For a process of one thread that is root, or the one user whose file the key is. Does nothing
// where no fleet is configured. What goes wrong shows as tokens that there are not.
void StartFleetSigner(const std::string& user);

// `hash` as of RequestHash. Empty where there is no signer or it will not. For one thread of one
// process at a time.
std::string FleetTokenFor(const FleetBox& box, const std::string& hash, int clock_offset);

}  // namespace nas
