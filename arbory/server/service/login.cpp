#include "arbory/server/service/login.h"

#include "arbory/server/service/library.h"
#include "nas/system/child.h"

namespace arbory {

nas::Child StartLogin(const Credentials& credentials, const PamService& service) {
  return nas::StartChild([&](int pipe) {
    nas::SendReply(pipe, {LoadServerLibrary().check_login(credentials, service), {}});
  });
}

nas::Child StartAccountCheck(const std::string& user, const PamService& service) {
  return nas::StartChild([&](int pipe) {
    nas::SendReply(pipe, {LoadServerLibrary().check_account(user, service), {}});
  });
}

}  // namespace arbory
