#include "nas/index/frames.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>

#include "nas/base/deadline.h"
#include "nas/base/system_call.h"

namespace nas {
namespace {

constexpr size_t kHeadBytes = sizeof(std::uint32_t) + 1;

}  // namespace

Status SendFrame(int connection, FrameType type, std::string_view payload) {
  const auto length = static_cast<std::uint32_t>(payload.size());
  if (length != payload.size()) return ErrnoError(EMSGSIZE);
  std::array<char, kHeadBytes> head;
  std::memcpy(head.data(), &length, sizeof length);
  head.back() = static_cast<char>(type);
  std::array<iovec, 2> parts = {iovec{head.data(), head.size()},
                                iovec{const_cast<char*>(payload.data()), payload.size()}};
  msghdr message = {};
  message.msg_iov = parts.data();
  message.msg_iovlen = parts.size();
  size_t left = head.size() + payload.size();
  while (left > 0) {
    const ssize_t sent = Uninterrupted([&] { return sendmsg(connection, &message, MSG_NOSIGNAL); });
    if (sent < 0) return ErrnoError();
    left -= static_cast<size_t>(sent);
    auto skip = static_cast<size_t>(sent);
    for (iovec& part : parts) {
      const size_t of_this = std::min(skip, part.iov_len);
      part.iov_base = static_cast<char*>(part.iov_base) + of_this;
      part.iov_len -= of_this;
      skip -= of_this;
    }
  }
  return {};
}

FrameReader::State FrameReader::Read(int timeout_ms, Frame* frame) {
  const Deadline deadline(timeout_ms);
  for (;;) {
    const size_t wanted = wanted_ > 0 ? wanted_ : kHeadBytes;
    const size_t have = bytes_.size();
    if (have < wanted) {
      pollfd readable = {connection_, POLLIN, 0};
      const int ready = Uninterrupted([&] { return poll(&readable, 1, deadline.left_ms()); });
      if (ready <= 0) return ready == 0 ? State::kNotYet : State::kBroken;
      bytes_.resize(wanted);
      const ssize_t got = Uninterrupted(
          [&] { return recv(connection_, bytes_.data() + have, wanted - have, MSG_DONTWAIT); });
      bytes_.resize(have + static_cast<size_t>(std::max<ssize_t>(got, 0)));
      if (got < 0 && errno == EAGAIN) continue;
      if (got <= 0) return bytes_.empty() ? State::kEnded : State::kBroken;
      continue;
    }
    if (wanted_ == 0) {
      std::uint32_t length = 0;
      std::memcpy(&length, bytes_.data(), sizeof length);
      if (length > max_payload_bytes_) return State::kBroken;
      wanted_ = kHeadBytes + length;
      continue;
    }
    frame->type = static_cast<FrameType>(static_cast<unsigned char>(bytes_[kHeadBytes - 1]));
    bytes_.erase(0, kHeadBytes);
    frame->payload = std::move(bytes_);
    bytes_.clear();
    wanted_ = 0;
    return State::kFrame;
  }
}

}  // namespace nas
