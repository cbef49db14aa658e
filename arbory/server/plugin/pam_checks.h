#pragma once
// What PAM says of accounts (server/service/login.h).

#include "arbory/server/service/library.h"

namespace arbory {

nas::ReplyHead CheckLogin(const Credentials& credentials, const PamService& service);
nas::ReplyHead CheckAccount(const std::string& user, const PamService& service);

}  // namespace arbory
