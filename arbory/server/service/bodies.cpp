#include "arbory/server/service/bodies.h"

namespace arbory {

class Bodies::Room : public BodyRoom {
 public:
  Room(Bodies* bodies, std::string user) : bodies_(*bodies), user_(std::move(user)) {}
  ~Room() override { bodies_.GiveBack(user_, counted_); }
  Room(const Room&) = delete;
  Room& operator=(const Room&) = delete;

  bool Take(std::uint64_t bytes) override {
    const std::uint64_t taken = taken_ + bytes;
    if (taken > kSmallBytes) {
      const std::uint64_t more = taken - kSmallBytes - counted_;
      if (user_.empty() || !bodies_.Take(user_, more)) return false;
      counted_ += more;
    }
    taken_ = taken;
    return true;
  }

 private:
  Bodies& bodies_;
  const std::string user_;
  std::uint64_t taken_ = 0;
  std::uint64_t counted_ = 0;
};

std::shared_ptr<BodyRoom> Bodies::RoomOf(const std::string& user) {
  return std::make_shared<Room>(this, user);
}

bool Bodies::Take(const std::string& user, std::uint64_t bytes) {
  const auto found = by_user_.find(user);
  const std::uint64_t of_user = found == by_user_.end() ? 0 : found->second;
  if (held_ + bytes > limits_.all || of_user + bytes > limits_.of_one_user) return false;
  held_ += bytes;
  by_user_[user] += bytes;
  return true;
}

void Bodies::GiveBack(const std::string& user, std::uint64_t bytes) {
  if (bytes == 0) return;
  held_ -= bytes;
  const auto found = by_user_.find(user);
  found->second -= bytes;
  if (found->second == 0) by_user_.erase(found);
}

}  // namespace arbory
