#pragma once
// A machine that says whatever a test likes, in the place of a box.

#include <atomic>
#include <functional>
#include <string>
#include <thread>

#include "nas/base/unique_fd.h"
#include "tests/fleet/fleet_test.h"

namespace fleet_test {

class FakeBox {
 public:
  // All that is sent for a request, which comes as it is read first, and `more` sends; the
  // connection ends with its return. Of a thread of its own.
  using Answer = std::function<void(const std::string& request,
                                    const std::function<bool(const std::string& bytes)>& send)>;
  explicit FakeBox(Answer answer);
  ~FakeBox();
  FakeBox(const FakeBox&) = delete;
  FakeBox& operator=(const FakeBox&) = delete;

  // To be named among a front's boxes.
  Box AsBox(const std::string& name) const;
  // A whole reply.
  static std::string Reply(const std::string& body, const std::string& fields = "",
                           const std::string& status = "200 OK");

 private:
  void Serve();

  const Answer answer_;
  nas::UniqueFd listener_;
  int port_ = 0;
  std::atomic<bool> ended_ = false;
  std::thread thread_;
};

}  // namespace fleet_test
