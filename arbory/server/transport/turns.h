#pragma once
// Work that may wait, such as reading to its end what was refused: a piece of it at a time, with
// whatever else the loop has to do between any two, however many have such work. Of the loop's
// thread alone. Included only where the network library is.

#include <boost/asio/io_context.hpp>
#include <boost/asio/post.hpp>
#include <deque>
#include <functional>

namespace arbory {

class Turns {
 public:
  // The loop must outlive it.
  explicit Turns(boost::asio::io_context* loop) : loop_(*loop) {}

  // Has `piece` done once those before it were.
  void Await(std::function<void()> piece) {
    waiting_.push_back(std::move(piece));
    Continue();
  }
  // To be called again after what the loop ran has thrown.
  void Continue() {
    if (waiting_.empty() || next_is_posted_) return;
    boost::asio::post(loop_, [this] {
      next_is_posted_ = false;
      const std::function<void()> piece = std::move(waiting_.front());
      waiting_.pop_front();
      Continue();
      piece();
    });
    next_is_posted_ = true;
  }

 private:
  boost::asio::io_context& loop_;
  std::deque<std::function<void()>> waiting_;
  bool next_is_posted_ = false;
};

}  // namespace arbory
