#pragma once
// The HTTP server: one thread, one loop, and the children that it starts. It knows connections and
// processes; what requests mean is the service's.
//
// Life: constructed (listening) -> Run, until SIGTERM or SIGINT -> no new connections and requests;
// running requests may finish for kFinishSeconds, then their children are killed; whatever child is
// left (search workers, which became this process's when their request's child ended) is told to
// stop by SIGTERM, and killed after kStopSeconds -> Run returns.

#include <functional>
#include <memory>
#include <string>

#include "arbory/server/transport/http.h"
#include "nas/system/config.h"

namespace arbory {

class HttpServer {
 public:
  // Listens. Throws std::runtime_error, in words for the user, for an address that is none or
  // cannot be had.
  explicit HttpServer(const nas::ServerSettings& settings);
  ~HttpServer();
  HttpServer(const HttpServer&) = delete;
  HttpServer& operator=(const HttpServer&) = delete;

  // Where it listens, with the port that the system chose for port 0.
  const std::string& address() const;  // "127.0.0.1:8750"
  int port() const;
  bool on_loopback() const;

  ServerCounts counts() const;
  // Calls `action` at each SIGHUP.
  void OnHangup(std::function<void()> action);
  void Run(HttpService* service);

 private:
  class Loop;
  std::unique_ptr<Loop> loop_;
};

}  // namespace arbory
