// Users and groups as the platform's records, which their receiver frees.

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "nas/base/accounts.h"
#include "nas/system/identity.h"
#include "platform/system.h"

namespace {

std::string Text(const char* text) { return text == nullptr ? "" : text; }

// A call mostly asks for the user whom it acts for, who has just been looked up.
nas::Result<nas::Account> AccountNamed(const std::string& name) {
  const auto& acting = nas::ActingAccount();
  if (acting && acting->name == name) return *acting;
  return nas::FindAccount(name);
}

int Fail(const nas::Error& error) {
  nas::Report(error);
  return -1;
}

}  // namespace

int NUVAUserGet(const char* name, NUVAUSER** out) {
  if (out == nullptr) return -1;
  *out = nullptr;
  const auto account = AccountNamed(Text(name));
  if (!account) return Fail(account.error());
  auto* user = static_cast<NUVAUSER*>(std::calloc(1, sizeof(NUVAUSER)));
  if (user == nullptr) return Fail(nas::ErrnoError(ENOMEM));
  *user = {strdup(account->name.c_str()), account->uid, account->gid,
           strdup(account->home.c_str())};
  if (user->szName == nullptr || user->szHome == nullptr) {
    NUVAUserFree(user);
    return Fail(nas::ErrnoError(ENOMEM));
  }
  *out = user;
  return 0;
}

void NUVAUserFree(NUVAUSER* user) {
  if (user == nullptr) return;
  std::free(user->szName);
  std::free(user->szHome);
  std::free(user);
}

int NUVAGroupGet(const char* name, NUVAGROUP** out) {
  if (out == nullptr) return -1;
  *out = nullptr;
  const auto found = nas::FindGroup(Text(name));
  if (!found) return Fail(found.error());
  auto* group = static_cast<NUVAGROUP*>(std::calloc(1, sizeof(NUVAGROUP)));
  if (group == nullptr) return Fail(nas::ErrnoError(ENOMEM));
  *group = {strdup(found->name.c_str()), found->gid};
  if (group->szName == nullptr) {
    NUVAGroupFree(group);
    return Fail(nas::ErrnoError(ENOMEM));
  }
  *out = group;
  return 0;
}

void NUVAGroupFree(NUVAGROUP* group) {
  if (group == nullptr) return;
  std::free(group->szName);
  std::free(group);
}
