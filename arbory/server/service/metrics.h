#pragma once
// Counts for monitoring, in the Prometheus text format, and the access log. Of the loop's thread
// alone; the counts begin with the process.

#include <array>
#include <cstdint>
#include <map>
#include <string>

#include "arbory/server/transport/http.h"

namespace arbory {

class Metrics {
 public:
  // `code` is the API's, or the HTTP status of a route of the server's own. `method` names a row of
  // the API or a route of the server's own; never what a client made up.
  void CountCall(const std::string& method, int code, double seconds);
  void CountReply(int status, std::uint64_t bytes);
  void CountRefusedLogin() { ++refused_logins_; }
  void CountEndedSessions(size_t count) { ended_sessions_ += count; }

  struct Now {
    size_t connections, running, workers, sessions;
  };
  std::string Text(const Now& now) const;

  // Upper bounds in seconds: from a page out of memory to a listing that waits for its search.
  static constexpr std::array kBounds = {0.005, 0.01, 0.025, 0.05, 0.1, 0.25,
                                         0.5,   1.0,  2.5,   10.0, 60.0};

 private:
  struct Durations {
    std::array<std::uint64_t, kBounds.size()> within{};
    std::uint64_t count = 0;
    double sum = 0;
  };
  std::map<std::pair<std::string, int>, std::uint64_t> calls_;
  std::map<std::string, Durations> durations_;
  std::map<int, std::uint64_t> replies_;
  std::uint64_t bytes_ = 0;
  std::uint64_t refused_logins_ = 0;
  std::uint64_t ended_sessions_ = 0;
};

// One line of JSON, with its newline, without what a query holds; no byte of it can be a command to
// a terminal.
std::string AccessLine(const HttpRequest& request, int status, std::uint64_t bytes);
// The same of sessions that ended with what their account was.
std::string EndedLine(const std::string& user, size_t sessions, const char* why);

}  // namespace arbory
