#include "arbory/server/service/calls.h"

#include "arbory/server/transport/http_text.h"

namespace arbory {
namespace {

constexpr char kRetrySeconds[] = "1";

// The reply as the child says it.
HttpReply ChildsReply(const nas::ReplyHead* head) {
  if (head == nullptr) return ErrorReply(kUnavailable, "The server failed here; try again.");
  HttpReply reply;
  reply.status = head->status;
  reply.child_follows = true;
  reply.fields = head->fields;
  if (reply.fields.empty()) reply.fields = JsonReply(kOk, "").fields;
  return reply;
}

}  // namespace

Answer Calls::Run(const std::string& user, const std::string& name,
                  const std::function<nas::Child()>& start) {
  int& of_user = by_user_[user];
  if (running_() >= static_cast<size_t>(limits_.all) || of_user >= limits_.of_one_user) {
    return BusyReply(kUnavailable, "The server is busy; try again in a moment.", kRetrySeconds);
  }
  ChildAnswer answer;
  answer.child = start();
  if (answer.child.pid < 0) {
    return BusyReply(kUnavailable, "The machine has no room for another request; try again.",
                     kRetrySeconds);
  }
  ++of_user;
  answer.token = std::shared_ptr<void>(nullptr, [this, user](void*) {
    if (--by_user_[user] == 0) by_user_.erase(user);
  });
  const auto begun = Clock::now();
  answer.make_reply = [this, name, begun](const nas::ReplyHead* head) {
    const std::chrono::duration<double> spent = Clock::now() - begun;
    const bool malformed = head != nullptr && head->status == kBadRequest;
    if (!name.empty() && !malformed) {
      metrics_.CountCall(name, head == nullptr ? nas::kCodeUnknownFailure : head->code,
                         spent.count());
    }
    return ChildsReply(head);
  };
  return answer;
}

}  // namespace arbory
