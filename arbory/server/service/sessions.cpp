#include "arbory/server/service/sessions.h"

#include <algorithm>

#include "nas/base/random_name.h"

namespace arbory {
namespace {

constexpr std::chrono::seconds kMinute{60};
// Beyond this many addresses and users, those whose minute is over are looked for and forgotten.
constexpr size_t kSweepAbove = 4096;

}  // namespace

std::string Sessions::Begin(const std::string& user, std::time_t now, const std::string& stamp) {
  Sweep(now);
  auto oldest = sessions_.end();
  int count = 0;
  for (auto at = sessions_.begin(); at != sessions_.end(); ++at) {
    if (at->second.user != user) continue;
    ++count;
    if (oldest == sessions_.end() || at->second.expires < oldest->second.expires) oldest = at;
  }
  if (count >= kMaxPerUser) sessions_.erase(oldest);
  const std::string id = nas::RandomName();
  sessions_[id] = {user, now + static_cast<std::time_t>(lifetime_.count()), stamp};
  return id;
}

std::optional<Sessions::Session> Sessions::Find(const std::string& id, std::time_t now) {
  const auto found = sessions_.find(id);
  if (found == sessions_.end()) return std::nullopt;
  if (found->second.expires > now) return found->second;
  sessions_.erase(found);
  return std::nullopt;
}

size_t Sessions::EndThoseOf(const std::string& user, const std::optional<std::string>& stamp) {
  return std::erase_if(sessions_, [&](const auto& entry) {
    return entry.second.user == user && entry.second.stamp != stamp;
  });
}

std::set<std::string> Sessions::Users(std::time_t now) {
  Sweep(now);
  std::set<std::string> users;
  for (const auto& [id, session] : sessions_) users.insert(session.user);
  return users;
}

size_t Sessions::Count(std::time_t now) {
  Sweep(now);
  return sessions_.size();
}

void Sessions::Sweep(std::time_t now) {
  std::erase_if(sessions_, [&](const auto& entry) { return entry.second.expires <= now; });
}

int LoginLimit::Begin(const std::string& address, const std::string& user, Time now) {
  if (attempts_.size() > kSweepAbove) Sweep(now);
  const std::pair<std::string, int> limits[] = {{"a" + address, per_minute_},
                                                {"u" + user, kAccountTimes * per_minute_}};
  int wait = 0;
  for (const auto& [key, limit] : limits) {
    auto& times = attempts_[key];
    while (!times.empty() && times.front() <= now - kMinute) times.pop_front();
    if (times.size() < static_cast<size_t>(limit)) continue;
    const auto left = std::chrono::ceil<std::chrono::seconds>(times.front() + kMinute - now);
    wait = std::max(wait, static_cast<int>(left.count()));
  }
  if (wait == 0) {
    for (const auto& [key, limit] : limits) attempts_[key].push_back(now);
  }
  return wait;
}

void LoginLimit::Succeeded(const std::string& address, const std::string& user) {
  for (const std::string& key : {"a" + address, "u" + user}) {
    const auto found = attempts_.find(key);
    if (found == attempts_.end() || found->second.empty()) continue;
    found->second.pop_back();
    if (found->second.empty()) attempts_.erase(found);
  }
}

void LoginLimit::Sweep(Time now) {
  std::erase_if(attempts_, [&](const auto& entry) {
    return entry.second.empty() || entry.second.back() <= now - kMinute;
  });
}

}  // namespace arbory
