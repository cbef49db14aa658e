#pragma once
// The loop's end of a child's pipe. Included only where the network library is.
//
// The pipe's end does not tell a child's death, since a search worker that the call forked may hold
// the pipe open for hours: whoever reaps children says so by OnExit, and what the child had written
// is still read.

#include <boost/asio/io_context.hpp>
#include <boost/asio/posix/stream_descriptor.hpp>
#include <boost/asio/steady_timer.hpp>
#include <functional>
#include <memory>
#include <string_view>

#include "arbory/server/transport/http.h"

namespace arbory {

class ChildPipe : public std::enable_shared_from_this<ChildPipe> {
 public:
  // Kills the child when it lets `patience` pass without giving or ending anything.
  ChildPipe(boost::asio::io_context& loop, nas::Child child, std::shared_ptr<void> token,
            std::chrono::seconds patience);

  using Reader = std::function<void(std::string_view bytes)>;
  // Calls `reader`, not from within, with bytes that are valid until it returns, or without
  // any when no more will come. One at a time.
  void Read(Reader reader);
  // Nobody wants the rest: the child finds its pipe closed when it writes.
  void Close();
  void OnExit();
  void Kill();

  pid_t pid() const { return pid_; }

 private:
  void Wait();
  void Deliver(bool may_wait);
  void Watch();

  boost::asio::posix::stream_descriptor pipe_;
  boost::asio::steady_timer timer_;
  pid_t pid_;
  bool exited_ = false;
  std::shared_ptr<void> token_;
  std::chrono::seconds patience_;
  Reader reader_;
};

}  // namespace arbory
