#pragma once
// How a request finds what answers it. One table, Service::Routes, says of each route how it is
// asked for, who may ask and what it is; the routing, the answers to other methods and the
// description for programs (openapi.cpp) all read it, so that none of them can forget a route.

#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "arbory/server/transport/http.h"

namespace arbory {

class Service;

// The decoded parts of a path, as SplitPath gives them.
using RequestPath = std::vector<std::string>;

enum class RouteMethod { kGet, kPost };  // what answers GET answers HEAD too

enum class Access {
  kEverybody,
  kThisMachine,  // clients on the machine itself
  kLoggedIn,     // with a session; the request's user is filled in
  kFront,        // with a front's token; the request's user and front are filled in
};

struct Route {
  RouteMethod method;
  // "/searches/{taskid}": a part in braces stands for any one part, and a last part "{name...}" for
  // any number of them, even none. The first pattern of the table that fits decides; several routes
  // with the same pattern answer different methods.
  const char* pattern;
  Access access;
  // Runs in the loop: what may take its time belongs into a child.
  Answer (*handler)(Service& service, HttpRequest* request, const RequestPath& path);
  const char* summary;     // null: for people, and left out of the description
  const char* reply_type;  // of the body; null without a summary
};

inline constexpr char kCallPattern[] = "/api/{api}/{version}/{method}";
inline constexpr char kManyParts[] = "...}";  // how a part that stands for any number ends

struct FoundRoute {
  const Route* route = nullptr;  // null: the path answers other methods only
  std::string allowed;           // those, as the field Allow has them
};

// `routes` must have a pattern for every path, so that one of the two is always found.
FoundRoute FindRoute(std::span<const Route> routes, std::string_view method,
                     const RequestPath& path);

}  // namespace arbory
