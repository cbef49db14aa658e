#pragma once
// A machine that says whatever a test likes, in the place of a box.

#include <atomic>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

#include "nas/base/unique_fd.h"
#include "tests/fleet/fleet_test.h"

namespace fleet_test {

class FakeBox {
 public:
  // All that is sent for a request, which comes as it is read first; the connection ends with its
  // return. Of a thread of its own: what it shares with the test is touched under Paused() alone.
  using Answer = std::function<void(const std::string& request,
                                    const std::function<bool(const std::string& bytes)>& send)>;
  explicit FakeBox(Answer answer);
  // One that sends what Say() was given last, and nothing before.
  FakeBox();
  ~FakeBox();
  FakeBox(const FakeBox&) = delete;
  FakeBox& operator=(const FakeBox&) = delete;

  void Say(std::string reply);
  // No answer is under way or begins while this is held; a front gives up a question without
  // waiting for its answer's end.
  std::unique_lock<std::mutex> Paused() { return std::unique_lock(answering_); }
  // To be named among a front's boxes.
  Box AsBox(const std::string& name) const;
  // A whole reply.
  static std::string Reply(const std::string& body, const std::string& fields = "",
                           const std::string& status = "200 OK");

 private:
  void Serve();

  const Answer answer_;
  std::mutex answering_;
  std::string said_;
  nas::UniqueFd listener_;
  int port_ = 0;
  std::atomic<bool> ended_ = false;
  std::thread thread_;
};

}  // namespace fleet_test
