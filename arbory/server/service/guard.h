#pragma once
// Whether a request comes from where it may come from. Browsers carry a user's cookie into requests
// that other sites' pages cause; these rules tell such requests apart. Functions of the
// request alone.

#include <string>
#include <vector>

#include "arbory/server/transport/http.h"

namespace arbory {

struct SiteRules {
  bool on_loopback = true;
  bool behind_tls = false;
  std::vector<std::string> origins;
};

// Each gives a sentence for the client; empty when all is well.

// On a loopback address the Host (which must be there) must be a loopback name, with any port, as
// tunnels change it, or the host of a configured origin: a page of another site whose name was made
// to lead to this machine would be believed to be of the same origin.
std::string TroubleWithHost(const HttpRequest& request, const SiteRules& rules);

// Origin, which browsers send with every POST, must be this server's own or a configured one.
// Without Origin it is no browser, or one that hides it: accepted without a cookie, and with one
// only where no Sec-Fetch-Site tells of a browser and the content type is one that other sites'
// pages cannot send unasked.
std::string TroubleWithOrigin(const HttpRequest& request, const SiteRules& rules);

// application/json, with or without parameters.
bool IsJson(const HttpRequest& request);

}  // namespace arbory
