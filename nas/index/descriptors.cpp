#include "nas/index/descriptors.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>

#include "nas/base/system_call.h"

namespace nas {
namespace {

constexpr size_t kControlBytes = CMSG_SPACE(Message::kMostDescriptors * sizeof(int));

}  // namespace

bool SendMessage(int socket, const Hello& hello, std::span<const int> descriptors) {
  iovec part = {const_cast<char*>(hello.data()), hello.size()};
  msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  alignas(cmsghdr) std::array<char, kControlBytes> control = {};
  if (!descriptors.empty()) {
    message.msg_control = control.data();
    message.msg_controllen = CMSG_SPACE(descriptors.size_bytes());
    cmsghdr* head = CMSG_FIRSTHDR(&message);
    head->cmsg_level = SOL_SOCKET;
    head->cmsg_type = SCM_RIGHTS;
    head->cmsg_len = CMSG_LEN(descriptors.size_bytes());
    std::memcpy(CMSG_DATA(head), descriptors.data(), descriptors.size_bytes());
  }
  const ssize_t sent =
      Uninterrupted([&] { return sendmsg(socket, &message, MSG_NOSIGNAL | MSG_DONTWAIT); });
  return sent == static_cast<ssize_t>(hello.size());
}

MessageState ReceiveMessage(int socket, Message* message) {
  iovec part = {message->hello.data(), message->hello.size()};
  msghdr received = {};
  received.msg_iov = &part;
  received.msg_iovlen = 1;
  alignas(cmsghdr) std::array<char, kControlBytes> control = {};
  received.msg_control = control.data();
  received.msg_controllen = control.size();
  const ssize_t got =
      Uninterrupted([&] { return recvmsg(socket, &received, MSG_DONTWAIT | MSG_CMSG_CLOEXEC); });
  for (cmsghdr* head = got < 0 ? nullptr : CMSG_FIRSTHDR(&received); head != nullptr;
       head = CMSG_NXTHDR(&received, head)) {
    if (head->cmsg_level != SOL_SOCKET || head->cmsg_type != SCM_RIGHTS) continue;
    const size_t count = (head->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (size_t at = 0; at < count; ++at) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(head) + at * sizeof descriptor, sizeof descriptor);
      UniqueFd owned(descriptor);
      if (at < message->descriptors.size()) message->descriptors[at] = std::move(owned);
    }
  }
  if (got < 0) return errno == EAGAIN ? MessageState::kNone : MessageState::kEnded;
  return got == static_cast<ssize_t>(message->hello.size()) ? MessageState::kMessage
                                                            : MessageState::kEnded;
}

}  // namespace nas
