#pragma once
// The HTTP server: one thread, one loop, and the children that it starts. It knows connections and
// processes; what requests mean is the service's.
//
// Life: constructed (listening) -> Run, until SIGTERM or SIGINT -> no new connections and requests;
// running requests may finish for kFinishTime, or until a second signal, then their children are
// killed; whatever child is left (search workers, which became this process's when their request's
// child ended) is told to stop by SIGTERM, and killed after kStopTime -> Run returns.
//
// One for each process, and of one thread: all children of the process are taken for the server's.
// What the service is asked, and what OnHangup names, runs in the loop and must not wait.

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "arbory/server/transport/http.h"
#include "nas/system/config.h"

namespace arbory {

class HttpServer {
 public:
  // Long enough for pages and short transfers to end; an administrator's restart waits for it.
  static constexpr std::chrono::seconds kFinishTime{5};
  // A worker that is told to stop does so within 100 ms, then writes its record.
  static constexpr std::chrono::seconds kStopTime{5};

  // Listens. Throws std::runtime_error, in words for the user, for an address that is none or
  // cannot be had.
  explicit HttpServer(const nas::ServerSettings& settings);
  ~HttpServer();
  HttpServer(const HttpServer&) = delete;
  HttpServer& operator=(const HttpServer&) = delete;

  // Where it is reached, with the port that the system chose for port 0; IPv6 in brackets. Of a
  // server that listens on all addresses, one of them.
  const std::string& address() const;  // "127.0.0.1:8750"
  int port() const;
  bool on_loopback() const;

  ServerCounts counts() const;
  // Calls `action` at each SIGHUP, from now on. Without one SIGHUP ends the server as SIGTERM does.
  // Before Run.
  void OnHangup(std::function<void()> action);
  // Answers requests until it is told to end; once. Makes the process the reaper of what its
  // children leave behind, and ignores SIGPIPE. `service` must live until it returns. Trouble with
  // one client or child is that one's; throws only for want of memory.
  void Run(HttpService* service);

 private:
  class Loop;
  std::unique_ptr<Loop> loop_;
};

}  // namespace arbory
