#include "arbory/server/service/routes.h"

#include <algorithm>

namespace arbory {
namespace {

bool Fits(std::string_view pattern, const RequestPath& path) {
  pattern.remove_prefix(1);
  for (const std::string& part : path) {
    const std::string_view wanted = pattern.substr(0, pattern.find('/'));
    if (wanted.ends_with(kManyParts)) return true;
    if (!wanted.starts_with('{') && wanted != part) return false;
    pattern.remove_prefix(std::min(pattern.size(), wanted.size() + 1));
  }
  return pattern.empty() ||
         (pattern.ends_with(kManyParts) && pattern.find('/') == std::string_view::npos);
}

bool Answers(RouteMethod route, std::string_view method) {
  if (route == RouteMethod::kPost) return method == "POST";
  return method == "GET" || method == "HEAD";
}

}  // namespace

FoundRoute FindRoute(std::span<const Route> routes, std::string_view method,
                     const RequestPath& path) {
  FoundRoute found;
  std::string_view pattern;
  for (const Route& route : routes) {
    if (pattern.empty() ? !Fits(route.pattern, path) : pattern != route.pattern) continue;
    pattern = route.pattern;
    if (Answers(route.method, method)) {
      found.route = &route;
      return found;
    }
    if (!found.allowed.empty()) found.allowed += ", ";
    found.allowed += route.method == RouteMethod::kPost ? "POST" : "GET, HEAD";
  }
  return found;
}

}  // namespace arbory
