#include "arbory/server/service/guard.h"

#include <algorithm>

#include "arbory/server/transport/http_text.h"

namespace arbory {
namespace {

// "[::1]:8750" -> "[::1]"; empty for what is no name with or without a port.
std::string HostName(const std::string& host) {
  const size_t bracket = host.rfind(']');
  const size_t colon = host.find(':', bracket == std::string::npos ? 0 : bracket);
  const std::string name = LowerCase(host.substr(0, colon));
  const bool port_is_number = colon == std::string::npos ||
                              host.find_first_not_of("0123456789", colon + 1) == std::string::npos;
  return port_is_number ? name : std::string();
}

std::string AfterScheme(const std::string& origin) {
  constexpr std::string_view kMark = "://";
  const size_t mark = origin.find(kMark);
  return mark == std::string::npos ? std::string() : origin.substr(mark + kMark.size());
}

bool IsLoopbackName(const std::string& name) {
  return name == "localhost" || name == "127.0.0.1" || name == "[::1]";
}

}  // namespace

std::string TroubleWithHost(const HttpRequest& request, const SiteRules& rules) {
  if (!rules.on_loopback) return {};
  const std::string name = HostName(*request.Field("host"));
  if (IsLoopbackName(name)) return {};
  for (const std::string& origin : rules.origins) {
    if (HostName(AfterScheme(origin)) == name) return {};
  }
  return "Open this server by the address it printed; for another name, add it to \"origins\" in "
         "the configuration.";
}

std::string TroubleWithOrigin(const HttpRequest& request, const SiteRules& rules) {
  const std::string* origin = request.Field("origin");
  if (origin == nullptr) {
    if (request.Field("cookie") == nullptr) return {};
    if (request.Field("sec-fetch-site") == nullptr && IsJson(request)) return {};
    return "Send the Origin field, or Content-Type: application/json if this is no browser.";
  }
  const std::string given = LowerCase(*origin);
  const std::string* host = request.Field("host");
  const std::string own = std::string(rules.behind_tls ? "https" : "http") + "://" +
                          LowerCase(host == nullptr ? "" : *host);
  const bool known = given == own || std::any_of(rules.origins.begin(), rules.origins.end(),
                                                 [&](const std::string& allowed) {
                                                   return LowerCase(allowed) == given;
                                                 });
  if (known && request.CountOf("origin") == 1) return {};
  return "This request was made by a page of another site; open Arbory Search itself. If this is "
         "its address, add it to \"origins\" in the configuration.";
}

bool IsJson(const HttpRequest& request) {
  const std::string* type = request.Field("content-type");
  if (type == nullptr) return false;
  std::string essence = LowerCase(type->substr(0, type->find(';')));
  while (essence.ends_with(' ')) essence.pop_back();
  return essence == "application/json";
}

}  // namespace arbory
