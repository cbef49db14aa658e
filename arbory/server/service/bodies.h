#pragma once
// How much of requests' bodies the server holds: little for whom it does not know, and a bounded
// number of bytes of one user and of all. What was taken is held until the child that got it has
// ended, so that this also bounds how many children of one user read large bodies. Of the loop's
// thread alone.

#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "arbory/server/transport/http.h"

namespace arbory {

class Bodies {
 public:
  // Held of any request without being counted: more than parameters without long lists take, and
  // little even for as many connections as there may be.
  static constexpr std::uint64_t kSmallBytes = std::uint64_t{16} << 10;

  // In bytes that are counted.
  struct Limits {
    std::uint64_t all = 0;
    std::uint64_t of_one_user = 0;
  };
  explicit Bodies(const Limits& limits) : limits_(limits) {}

  // Room for one body; for a small one alone where the user is empty. This object must outlive it.
  std::shared_ptr<BodyRoom> RoomOf(const std::string& user);

 private:
  class Room;
  bool Take(const std::string& user, std::uint64_t bytes);
  void GiveBack(const std::string& user, std::uint64_t bytes);

  const Limits limits_;
  std::uint64_t held_ = 0;
  std::map<std::string, std::uint64_t> by_user_;
};

}  // namespace arbory
