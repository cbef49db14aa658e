#pragma once
// Owners of the platform's user and group records.

#include <memory>

#include "platform/system.h"

struct UserFree {
  void operator()(NUVAUSER* user) const { NUVAUserFree(user); }
};
struct GroupFree {
  void operator()(NUVAGROUP* group) const { NUVAGroupFree(group); }
};
using UserRecord = std::unique_ptr<NUVAUSER, UserFree>;
using GroupRecord = std::unique_ptr<NUVAGROUP, GroupFree>;

// Null when there is no such user.
inline UserRecord GetUser(const char* name) {
  NUVAUSER* user = nullptr;
  return NUVAUserGet(name, &user) == 0 ? UserRecord(user) : UserRecord();
}

inline GroupRecord GetGroup(const char* name) {
  NUVAGROUP* group = nullptr;
  return NUVAGroupGet(name, &group) == 0 ? GroupRecord(group) : GroupRecord();
}
