#pragma once
// Tokens for one user, from a process that has the front's secret key.
//
// Who asks boxes runs as the user, and must not have a key that speaks for everybody. So while the
// process still is what it was started as, a child of it reads the key, and from then on signs for
// this user alone, for the boxes of the configuration, whatever it is asked by the process and its
// forks; it ends with the last of them. Protocol, over a connection that keeps messages apart: a
// message of lines "BOX HASH OFFSET", the offset that of the box's clock in seconds; then one with
// as many lines, each the token or "-" where there is none.

#include <deque>
#include <string>

#include "nas/base/error.h"
#include "nas/system/config.h"

namespace nas {

// For a process of one thread that is root, or the one user whose file the key is. Does nothing
// where no fleet is configured. What goes wrong shows as tokens that there are not.
void StartFleetSigner(const std::string& user);

// Tokens in the order they were asked for. A signature takes longer than all else that is done for
// a request, so some are under way while earlier ones are used. For one thread of one process at a
// time, and for one queue of them.
class FleetTokens {
 public:
  FleetTokens() = default;
  // Takes what is under way, so that nobody else does.
  ~FleetTokens() { Drop(); }
  FleetTokens(const FleetTokens&) = delete;
  FleetTokens& operator=(const FleetTokens&) = delete;

  // `hash` as of RequestHash.
  void Ask(const FleetBox& box, const std::string& hash, int clock_offset);
  // The next one, of those asked for and not taken; waits for it. Empty where there is no signer or
  // it will not.
  std::string Take();
  void Drop();

 private:
  void Send();
  bool Receive();

  std::deque<std::string> questions_;  // that the signer has not been sent
  std::deque<size_t> under_way_;       // messages, by their lines
  std::deque<std::string> tokens_;     // that it has answered with
};

}  // namespace nas
