#pragma once
// A hello, and descriptors with it, from one process to another: from the asker to the broker, and
// from the broker to a watcher.

#include <array>
#include <span>

#include "nas/base/unique_fd.h"
#include "nas/index/client.h"

namespace nas {

using Hello = std::array<char, kHelloBytes>;

struct Message {
  static constexpr size_t kMostDescriptors = 2;
  Hello hello = {};
  std::array<UniqueFd, kMostDescriptors> descriptors;  // in the order of sending; more are closed
};

// False where it cannot be sent at once and whole. The descriptors stay the caller's.
bool SendMessage(int socket, const Hello& hello, std::span<const int> descriptors);

enum class MessageState { kMessage, kNone, kEnded };
// Takes one that has come, without waiting. kEnded where the other end is gone or broke off.
MessageState ReceiveMessage(int socket, Message* message);

}  // namespace nas
