#include "arbory/server/transport/child.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <cstring>

#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/webapi/request_child.h"

namespace arbory {
namespace {

constexpr size_t kLengthBytes = sizeof(std::uint64_t);
// Far above what a head holds: a file's name in two encodings and a few short fields.
constexpr size_t kMaxHeadBytes = size_t{16} << 10;

std::string HeadText(const ChildHead& head) {
  std::string text = std::to_string(head.status) + " " + std::to_string(head.code) + "\n";
  for (const auto& [name, value] : head.fields) text += name + ": " + value + "\n";
  return text + "\n";
}

bool ParseNumbers(std::string_view line, ChildHead* head) {
  const char* end = line.data() + line.size();
  const auto status = std::from_chars(line.data(), end, head->status);
  if (status.ec != std::errc() || status.ptr == end || *status.ptr != ' ') return false;
  const auto code = std::from_chars(status.ptr + 1, end, head->code);
  return code.ec == std::errc() && code.ptr == end;
}

}  // namespace

std::string EncodeApiReply(int code, const Json::Value& data) {
  std::string text = HeadText({kOk, code, {}});
  text += "{\"code\":" + std::to_string(code) + ",\"data\":";
  nas::AppendJson(data, nas::JsonBytes::kClean, &text);
  text += '}';
  return text;
}

std::string EncodeOwnReply(int code, const Json::Value& data) {
  // The runner answers by itself, without data, when the call could not even begin.
  if (data.isNull()) {
    return HeadText({kUnavailable, kUnavailable, {}}) +
           ErrorReply(kUnavailable,
                      "The user's state folder cannot be used; the system log says why.")
               .body;
  }
  return HeadText({code, code, {}}) + nas::JsonText(data, nas::JsonBytes::kClean);
}

nas::RunningCall StartChild(const std::function<void(int pipe)>& body) {
  nas::RunningCall running;
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) return running;
  running.fd = nas::UniqueFd(ends[0]);
  const nas::UniqueFd writable(ends[1]);
  running.pid = fork();
  if (running.pid == 0) {
    const int pipe = nas::EnterChild(writable.get());
    try {
      if (pipe >= 0) body(pipe);
    } catch (...) {
      // Nothing was sent, which is an answer too.
    }
    _exit(EXIT_SUCCESS);
  }
  if (running.pid < 0) running.fd.Reset();
  return running;
}

bool SendHead(int pipe, const ChildHead& head, std::uint64_t body_bytes) {
  const std::string text = HeadText(head);
  const std::uint64_t length = text.size() + body_bytes;
  std::string bytes(reinterpret_cast<const char*>(&length), sizeof length);
  return nas::WriteAll(pipe, bytes + text).ok();
}

bool SendReply(int pipe, const ChildHead& head, std::string_view body) {
  return SendHead(pipe, head, body.size()) && nas::WriteAll(pipe, body).ok();
}

HeadReader::State HeadReader::Feed(std::string_view bytes) {
  bytes_.append(bytes);
  return Parse();
}

HeadReader::State HeadReader::Parse() {
  if (bytes_.size() < kLengthBytes) return State::kMore;
  std::uint64_t length = 0;
  std::memcpy(&length, bytes_.data(), sizeof length);
  const std::string_view text = std::string_view(bytes_).substr(kLengthBytes);
  const size_t end = text.substr(0, kMaxHeadBytes).find("\n\n");
  if (end == std::string_view::npos) {
    return text.size() >= std::min<std::uint64_t>(kMaxHeadBytes, length) ? State::kBroken
                                                                         : State::kMore;
  }
  const size_t head_bytes = end + 2;
  if (length < head_bytes) return State::kBroken;
  std::string_view rest = text.substr(0, end + 1);
  const std::string_view numbers = rest.substr(0, rest.find('\n'));
  if (!ParseNumbers(numbers, &head_)) return State::kBroken;
  rest.remove_prefix(numbers.size() + 1);
  while (!rest.empty()) {
    const std::string_view line = rest.substr(0, rest.find('\n'));
    rest.remove_prefix(line.size() + 1);
    const size_t colon = line.find(": ");
    if (colon == std::string_view::npos) return State::kBroken;
    head_.fields.emplace_back(line.substr(0, colon), line.substr(colon + 2));
  }
  body_at_ = kLengthBytes + head_bytes;
  body_bytes_ = length - head_bytes;
  // A worker may have written behind the frame; that is nobody's.
  if (bytes_.size() - body_at_ > body_bytes_) bytes_.resize(body_at_ + body_bytes_);
  return State::kReady;
}

}  // namespace arbory
