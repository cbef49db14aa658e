#include "arbory/server/service/session_checks.h"

#include <unistd.h>

#include <algorithm>
#include <ctime>

#include "nas/base/file_io.h"

namespace arbory {

SessionChecks::SessionChecks(Rules rules, Sessions* sessions, Calls* calls, Metrics* metrics)
    : rules_(std::move(rules)), sessions_(*sessions), calls_(*calls), metrics_(*metrics) {}

std::optional<std::vector<ChildAnswer>> SessionChecks::Due(Clock::time_point now) {
  FollowUsers(now);
  if (checks_.empty()) return std::nullopt;
  std::vector<Checks::iterator> due;
  for (auto at = checks_.begin(); at != checks_.end(); ++at) {
    if (at->second.due <= now && at->second.running.expired()) due.push_back(at);
  }
  std::sort(due.begin(), due.end(),
            [](const auto& a, const auto& b) { return a->second.due < b->second.due; });
  // So many in each second that all have their turn within a pause.
  const auto seconds = static_cast<size_t>(rules_.pause.count());
  due.resize(std::min(due.size(), (checks_.size() + seconds - 1) / seconds));
  std::vector<ChildAnswer> children;
  for (const auto& each : due) {
    auto child = Start(each->first, &each->second);
    if (!child) break;
    each->second.due = now + rules_.pause;
    children.push_back(std::move(*child));
  }
  return children;
}

void SessionChecks::FollowUsers(Clock::time_point now) {
  const std::set<std::string> users = sessions_.Users(std::time(nullptr));
  std::erase_if(checks_, [&](const auto& entry) {
    return !users.contains(entry.first) && entry.second.running.expired();
  });
  for (const std::string& user : users) checks_.try_emplace(user, Check{now + rules_.pause});
}

std::optional<ChildAnswer> SessionChecks::Start(const std::string& user, Check* check) {
  Answer answer = calls_.Run(Calls::Kind::kCheck, user, "",
                             [&] { return StartAccountCheck(user, rules_.pam); });
  auto* child = std::get_if<ChildAnswer>(&answer);
  if (child == nullptr) return std::nullopt;
  check->running = child->token;
  child->make_reply = [this, user](const nas::ReplyHead* head) {
    Judge(user, head);
    return HttpReply();
  };
  return std::move(*child);
}

void SessionChecks::Judge(const std::string& user, const nas::ReplyHead* head) {
  if (head == nullptr || head->status == kUnavailable) return;
  const bool open = head->status == kOk;
  const size_t ended =
      sessions_.EndThoseOf(user, open ? std::optional(head->fields.at(1).second) : std::nullopt);
  if (ended == 0) return;
  metrics_.CountEndedSessions(ended);
  const char* why = open ? "the password was changed" : "the account may log in no more";
  if (rules_.log) (void)nas::WriteAll(STDERR_FILENO, EndedLine(user, ended, why));
}

}  // namespace arbory
