#include "arbory/server/transport/addresses.h"

#include <ifaddrs.h>
#include <net/if.h>
#include <netinet/in.h>

#include <algorithm>
#include <boost/asio/ip/address.hpp>
#include <cstring>
#include <memory>
#include <optional>
#include <stdexcept>

namespace arbory {
namespace {

namespace ip = boost::asio::ip;

constexpr size_t kNetworkBytes = 8;

// An IPv4 address that came over an IPv6 socket is the same client's.
std::optional<ip::address> Parse(const std::string& text) {
  boost::system::error_code error;
  const ip::address address = ip::make_address(text, error);
  if (error) return std::nullopt;
  if (address.is_v6() && address.to_v6().is_v4_mapped()) {
    return ip::make_address_v4(ip::v4_mapped, address.to_v6());
  }
  return address;
}

// The entries of all fields of that name, in their order.
std::vector<std::string> Forwarded(const HttpRequest& request) {
  constexpr char kSpace[] = " \t";
  std::vector<std::string> hops;
  for (const auto& [name, value] : request.fields) {
    if (name != "x-forwarded-for") continue;
    for (size_t at = 0; at <= value.size();) {
      const size_t end = std::min(value.find(',', at), value.size());
      std::string hop = value.substr(at, end - at);
      hop.erase(0, hop.find_first_not_of(kSpace));
      hop.erase(hop.find_last_not_of(kSpace) + 1);
      hops.push_back(std::move(hop));
      at = end + 1;
    }
  }
  return hops;
}

}  // namespace

Proxies::Proxies(const std::vector<std::string>& addresses) {
  for (const std::string& text : addresses) {
    const auto address = Parse(text);
    if (!address) {
      throw std::runtime_error("'" + text + "' in proxies is no address; give one like 127.0.0.1");
    }
    addresses_.insert(address->to_string());
  }
}

ClientAddress Proxies::ClientOf(const std::string& peer, const HttpRequest& request) const {
  auto client = Parse(peer);
  if (!client) return {peer, false};
  std::vector<std::string> hops = Forwarded(request);
  while (!hops.empty() && addresses_.contains(client->to_string())) {
    const auto before = Parse(hops.back());
    hops.pop_back();
    if (!before) break;
    client = before;
  }
  return {client->to_string(), client->is_loopback()};
}

std::string NetworkOf(const std::string& address) {
  const auto parsed = Parse(address);
  if (!parsed || parsed->is_v4()) return parsed ? parsed->to_string() : address;
  auto bytes = parsed->to_v6().to_bytes();
  std::fill(bytes.begin() + kNetworkBytes, bytes.end(), 0);
  return ip::make_address_v6(bytes).to_string();
}

namespace {

// Empty for what nobody would type: another family, and addresses of one link alone.
std::string TextOf(const sockaddr* address) {
  if (address == nullptr) return {};
  if (address->sa_family == AF_INET) {
    sockaddr_in v4;
    std::memcpy(&v4, address, sizeof(v4));
    return ip::address_v4(ntohl(v4.sin_addr.s_addr)).to_string();
  }
  if (address->sa_family != AF_INET6) return {};
  sockaddr_in6 v6;
  std::memcpy(&v6, address, sizeof(v6));
  ip::address_v6::bytes_type bytes;
  std::memcpy(bytes.data(), &v6.sin6_addr, bytes.size());
  const ip::address_v6 text(bytes);
  return text.is_link_local() ? std::string() : text.to_string();
}

}  // namespace

std::string OwnAddress(const std::string& any) {
  const bool v6 = any.find(':') != std::string::npos;
  ifaddrs* list = nullptr;
  if (getifaddrs(&list) != 0) list = nullptr;
  const std::unique_ptr<ifaddrs, void (*)(ifaddrs*)> held(list, freeifaddrs);
  std::string best = v6 ? "::1" : "127.0.0.1";
  bool same_family = false;
  for (const ifaddrs* at = list; at != nullptr; at = at->ifa_next) {
    const std::string text = TextOf(at->ifa_addr);
    if (text.empty() || (at->ifa_flags & IFF_UP) == 0 || (at->ifa_flags & IFF_LOOPBACK) != 0) {
      continue;
    }
    // A socket for all IPv6 addresses takes IPv4 too.
    const bool same = (at->ifa_addr->sa_family == AF_INET6) == v6;
    if (same_family || (!same && !v6)) continue;
    best = text;
    same_family = same;
  }
  return best;
}

}  // namespace arbory
