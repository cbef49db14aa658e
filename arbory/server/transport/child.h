#pragma once
// Children that answer requests, and what they say.
//
// A child's one frame (nas/webapi/runner.h) holds a head and a body:
//
//   STATUS CODE\n          HTTP status, and the API's code for the access counts
//   Name: value\n          header fields, any number
//   \n
//   body                   the rest of the frame
//
// The head tells what the server must know, so that it can pass the body on, however large, without
// looking into it. A child that ends before its frame is whole has failed.

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "arbory/server/transport/http.h"

namespace arbory {

// The reply of an API call: status 200 and {"code":N,"data":...}.
std::string EncodeApiReply(int code, const Json::Value& data);
// The reply of a row of the server's own: the code is the HTTP status and the data its JSON body.
std::string EncodeOwnReply(int code, const Json::Value& data);

// Forks a child for work that is no API call. It has standard streams and the pipe open and nothing
// else, and the server's identity; it ends when `body` returns.
nas::RunningCall StartChild(const std::function<void(int pipe)>& body);
// Sends the frame's beginning; `body_bytes` more must follow.
bool SendHead(int pipe, const ChildHead& head, std::uint64_t body_bytes);
bool SendReply(int pipe, const ChildHead& head, std::string_view body);

// Collects a child's frame up to where the body begins.
class HeadReader {
 public:
  enum class State { kMore, kReady, kBroken };
  State Feed(std::string_view bytes);

  const ChildHead& head() const { return head_; }
  std::uint64_t body_bytes() const { return body_bytes_; }
  // What came of the body together with the head.
  std::string_view body_begin() const { return std::string_view(bytes_).substr(body_at_); }

 private:
  State Parse();

  std::string bytes_;
  ChildHead head_;
  std::uint64_t body_bytes_ = 0;
  size_t body_at_ = 0;
};

}  // namespace arbory
