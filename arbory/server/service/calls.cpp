#include "arbory/server/service/calls.h"

#include <cmath>

#include "arbory/server/transport/http_text.h"

namespace arbory {
namespace {

constexpr char kRetrySeconds[] = "1";
// At once: each waits for PAM, which may wait for a directory server.
constexpr int kLogins = 16;
constexpr int kChecks = 8;
// Durations of logins are told no finer: a password's check ends sooner for a user that there is
// not, which the reply's delay hides.
constexpr double kLoginSeconds = 2;

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

std::shared_ptr<void> Places::Take(const std::string& who) {
  const auto found = by_taker_.find(who);
  const int of_taker = found == by_taker_.end() ? 0 : found->second;
  const int left = all_ - taken_;
  if (left <= 0 || (shared_ && of_taker >= left)) return nullptr;
  ++taken_;
  ++by_taker_[who];
  // Any address but null will do.
  return {static_cast<void*>(this), [this, who](void*) {
            --taken_;
            if (--by_taker_[who] == 0) by_taker_.erase(who);
          }};
}

Calls::Calls(int calls, bool several_users, Metrics* metrics)
    : calls_(calls, several_users),
      downloads_((calls + 1) / 2, several_users),
      logins_(kLogins, /*shared=*/true),
      checks_(kChecks, /*shared=*/false),
      fronts_((calls + 1) / 2, /*shared=*/true),
      metrics_(*metrics) {}

Places& Calls::PlacesOf(Kind kind) {
  if (kind == Kind::kLogin) return logins_;
  if (kind == Kind::kCheck) return checks_;
  if (kind == Kind::kFront) return fronts_;
  return kind == Kind::kDownload ? downloads_ : calls_;
}

Answer Calls::Run(Kind kind, const std::string& who, const std::string& name,
                  const std::function<nas::Child()>& start) {
  ChildAnswer answer;
  answer.token = PlacesOf(kind).Take(who);
  if (!answer.token) {
    return BusyReply(kUnavailable, "The server is busy; try again in a moment.", kRetrySeconds);
  }
  answer.child = start();
  if (answer.child.pid < 0) {
    return BusyReply(kUnavailable, "The machine has no room for another request; try again.",
                     kRetrySeconds);
  }
  const auto begun = Clock::now();
  answer.make_reply = [this, kind, name, begun](const nas::ReplyHead* head) {
    double spent = std::chrono::duration<double>(Clock::now() - begun).count();
    if (kind == Kind::kLogin) spent = kLoginSeconds * std::ceil(spent / kLoginSeconds);
    const bool malformed = head != nullptr && head->status == kBadRequest;
    if (!name.empty() && !malformed) {
      metrics_.CountCall(name, head == nullptr ? nas::kCodeUnknownFailure : head->code, spent);
    }
    return ChildsReply(head);
  };
  return answer;
}

}  // namespace arbory
