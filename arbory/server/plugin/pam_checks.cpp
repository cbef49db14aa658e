#include "arbory/server/plugin/pam_checks.h"

#include <security/pam_appl.h>
#include <shadow.h>
#include <syslog.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "arbory/server/transport/http_text.h"
#include "nas/base/accounts.h"

namespace arbory {
namespace {

// Far more than the longest line of a shadow file.
constexpr size_t kShadowBytes = size_t{16} << 10;

// Answers what PAM asks: a hidden question is taken for the password, a shown one for the name.
int Converse(int count, const pam_message** questions, pam_response** answers, void* data) {
  const auto* credentials = static_cast<const Credentials*>(data);
  if (count <= 0 || count > PAM_MAX_NUM_MSG) return PAM_CONV_ERR;
  // PAM frees it with the texts in it.
  auto* given = static_cast<pam_response*>(std::calloc(count, sizeof(pam_response)));
  if (given == nullptr) return PAM_BUF_ERR;
  for (int at = 0; at < count; ++at) {
    const int style = questions[at]->msg_style;
    if (style == PAM_PROMPT_ECHO_OFF) given[at].resp = strdup(credentials->password.c_str());
    if (style == PAM_PROMPT_ECHO_ON) given[at].resp = strdup(credentials->user.c_str());
  }
  *answers = given;
  return PAM_SUCCESS;
}

// The server itself delays every refusal alike.
void NoDelay(int /*status*/, unsigned /*microseconds*/, void* /*data*/) {}

class Pam {
 public:
  Pam(const Credentials& credentials, const PamService& service) {
    conversation_ = {Converse, const_cast<Credentials*>(&credentials)};
    status_ =
        pam_start_confdir(service.name.c_str(), credentials.user.c_str(), &conversation_,
                          service.folder.empty() ? nullptr : service.folder.c_str(), &handle_);
    if (status_ == PAM_SUCCESS) {
      pam_set_item(handle_, PAM_FAIL_DELAY, reinterpret_cast<const void*>(&NoDelay));
    }
  }
  ~Pam() {
    if (handle_ != nullptr) pam_end(handle_, status_);
  }
  Pam(const Pam&) = delete;
  Pam& operator=(const Pam&) = delete;

  int CheckPassword() {
    if (status_ == PAM_SUCCESS) status_ = pam_authenticate(handle_, PAM_DISALLOW_NULL_AUTHTOK);
    return status_;
  }
  int CheckAccount() {
    if (status_ == PAM_SUCCESS) status_ = pam_acct_mgmt(handle_, PAM_DISALLOW_NULL_AUTHTOK);
    return status_;
  }

  // After a check that let the user in. Modules may map the name given to another one.
  nas::Result<nas::Account> Account() const {
    const void* name = nullptr;
    if (pam_get_item(handle_, PAM_USER, &name) != PAM_SUCCESS || name == nullptr) {
      return nas::Error{nas::kErrorUnknownUser, ENOENT};
    }
    return nas::FindAccount(static_cast<const char*>(name));
  }

 private:
  pam_conv conversation_;
  pam_handle_t* handle_ = nullptr;
  int status_ = PAM_ABORT;
};

// What stands for the password, and for its lock, which is a part of it. Nothing that a password
// could be guessed by leaves this process. An error where the shadow file cannot be read.
nas::Result<std::string> StampOf(const std::string& user) {
  std::vector<char> room(kShadowBytes);
  spwd entry;
  spwd* found = nullptr;
  const int trouble = getspnam_r(user.c_str(), &entry, room.data(), room.size(), &found);
  if (found == nullptr && trouble != 0 && trouble != ENOENT) {
    return nas::Error{nas::kErrorOther, trouble};
  }
  if (found == nullptr) return std::string();
  return std::to_string(
      std::hash<std::string>{}(std::to_string(found->sp_lstchg) + ":" + found->sp_pwdp));
}

nas::ReplyHead LetIn(const std::string& user, const std::string& stamp) {
  return {kOk, 0, {{"User", PercentEncoded(user)}, {"Stamp", stamp}}};
}

}  // namespace

nas::ReplyHead CheckLogin(const Credentials& credentials, const PamService& service) {
  const nas::ReplyHead refused{kForbidden, kForbidden, {}};
  // Before the password is looked at: one that is changed meanwhile is then a later one.
  auto stamp = StampOf(credentials.user);
  Pam pam(credentials, service);
  int status = pam.CheckPassword();
  if (status == PAM_SUCCESS) status = pam.CheckAccount();
  // Modules tell a wrong password by many codes, some of which are also those of their own trouble,
  // so the client is told one thing and the administrator the other.
  if (status != PAM_SUCCESS) {
    syslog(LOG_NOTICE, "login refused by service %s: %s", service.name.c_str(),
           pam_strerror(nullptr, status));
    return refused;
  }
  const auto account = pam.Account();
  if (!account) {
    syslog(LOG_NOTICE, "login refused, as there is no such account: %s",
           account.error().Text().c_str());
    return refused;
  }
  if (account->name != credentials.user) stamp = StampOf(account->name);
  if (!stamp) {
    syslog(LOG_ERR, "login refused, as the shadow file cannot be read: %s",
           stamp.error().Text().c_str());
    return refused;
  }
  return LetIn(account->name, *stamp);
}

nas::ReplyHead CheckAccount(const std::string& user, const PamService& service) {
  const nas::ReplyHead unknown{kUnavailable, kUnavailable, {}};
  const auto stamp = StampOf(user);
  if (!stamp) {
    syslog(LOG_ERR, "%s's account cannot be checked: %s", user.c_str(),
           stamp.error().Text().c_str());
    return unknown;
  }
  const Credentials nobody{user, ""};
  const int status = Pam(nobody, service).CheckAccount();
  if (status == PAM_SUCCESS) return LetIn(user, *stamp);
  syslog(LOG_NOTICE, "%s may be logged in no more by service %s: %s", user.c_str(),
         service.name.c_str(), pam_strerror(nullptr, status));
  // A directory server that does not answer says nothing of the account.
  if (status == PAM_AUTHINFO_UNAVAIL || status == PAM_BUF_ERR) return unknown;
  return {kForbidden, kForbidden, {}};
}

}  // namespace arbory
