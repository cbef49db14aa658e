#pragma once
// Who is logged in. Sessions live in this process's memory: they end with it, and nobody can read
// them from a disk. Of the loop's thread alone; `now` is given so that time can be tested.

#include <chrono>
#include <ctime>
#include <deque>
#include <map>
#include <optional>
#include <set>
#include <string>

namespace arbory {

class Sessions {
 public:
  explicit Sessions(std::chrono::seconds lifetime) : lifetime_(lifetime) {}

  // `stamp` is what the user's account was known by then (login.h). A new session's id: 128 random
  // bits in hexadecimal. Throws std::runtime_error without randomness. A user with kMaxPerUser
  // sessions loses the one that would end first.
  std::string Begin(const std::string& user, std::time_t now, const std::string& stamp = {});
  struct Session {
    std::string user;
    std::time_t expires;
    std::string stamp = {};
  };
  // Nothing for an id that is unknown or past its time.
  std::optional<Session> Find(const std::string& id, std::time_t now);
  void End(const std::string& id) { sessions_.erase(id); }
  // Ends the user's sessions but those with the stamp given, or all without one; how many.
  size_t EndThoseOf(const std::string& user, const std::optional<std::string>& stamp);
  size_t Count(std::time_t now);
  std::set<std::string> Users(std::time_t now);

  static constexpr int kMaxPerUser = 32;  // browsers and scripts of one person

 private:
  void Sweep(std::time_t now);

  std::chrono::seconds lifetime_;
  std::map<std::string, Session> sessions_;
};

// Counts refused logins of the last minute by address and by account. Of an account many more are
// let through than of an address: that bounds guessing from many places, and one stranger's
// refusals lock nobody out of an account of theirs. An attempt counts from its beginning, so that
// many at once do not slip through, and is taken back when it succeeds.
class LoginLimit {
 public:
  explicit LoginLimit(int per_minute) : per_minute_(per_minute) {}

  static constexpr int kAccountTimes = 10;  // as many refusals as of one address

  using Time = std::chrono::steady_clock::time_point;
  // Seconds to wait before another attempt; 0 when it may begin now, and then it has.
  int Begin(const std::string& address, const std::string& user, Time now);
  void Succeeded(const std::string& address, const std::string& user);

 private:
  void Sweep(Time now);

  const int per_minute_;
  // Times of attempts, by "a" + address and "u" + user.
  std::map<std::string, std::deque<Time>> attempts_;
};

}  // namespace arbory
