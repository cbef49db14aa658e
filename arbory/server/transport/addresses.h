#pragma once
// Addresses of clients: whose request it is when a proxy brings it, and what counts as one client.

#include <set>
#include <string>
#include <vector>

#include "arbory/server/transport/http.h"

namespace arbory {

struct ClientAddress {
  std::string text;
  bool loopback = false;
};

// The proxies in front of the server.
class Proxies {
 public:
  // Throws std::runtime_error, in words for the user, for a text that is no address.
  explicit Proxies(const std::vector<std::string>& addresses);

  // Who sent a request that came over a connection from `peer`. A proxy appends to X-Forwarded-For
  // whom it got the request from, so the list is read from its end for as long as the one who wrote
  // an entry is a configured proxy: what stands before that, anybody may have made up. Without an
  // entry, or with one that is no address, it is the last proxy known.
  ClientAddress ClientOf(const std::string& peer, const HttpRequest& request) const;

 private:
  std::set<std::string> addresses_;
};

// What stands for one client in counts: the address, or of IPv6 the network of 64 bits, as whoever
// has one such address has them all. The text itself where it is no address.
std::string NetworkOf(const std::string& address);

// Where this machine can be reached when a server listens on all of its addresses, which
// `any` is: one that is not loopback, else loopback. IPv6 ones without brackets.
std::string OwnAddress(const std::string& any);

}  // namespace arbory
