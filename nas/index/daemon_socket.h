#pragma once
// Where the index daemon listens, and connecting to it:
//
//   what `socket` in [index] says
//   /run/arbory/index.sock   root's daemon with the system's state directory; 0666, so that every
//                            user can ask, in a folder that only root can change
//   STATE/index.sock         any other; 0600 where it is not root's
//
// Any thread may call.

#include <sys/types.h>

#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"

namespace nas {

// Where this process, as the daemon, would listen.
std::string OwnIndexSocket();
// Where to look for a daemon, in this order.
std::vector<std::string> IndexSockets();

// A connection to the daemon that listens there, made at once or not at all; no read or write on it
// waits longer than `timeout_ms`. EPERM where the listener is neither root's nor one's own, EAGAIN
// where too many wait already.
Result<UniqueFd> ConnectToIndex(const std::string& path, int timeout_ms);

// A socket that listens there, O_NONBLOCK, in the place of one that nobody listens at any more.
// EADDRINUSE where somebody does, EPERM where others than root and oneself could replace it.
// Makes the folder. For one thread: it sets the umask.
Result<UniqueFd> ListenForIndex(const std::string& path);

// Who connected, as they were then, told by the kernel.
struct Peer {
  uid_t uid = 0;
  gid_t gid = 0;
  std::vector<gid_t> groups;  // the others
};
Result<Peer> PeerOf(int connection);

}  // namespace nas
