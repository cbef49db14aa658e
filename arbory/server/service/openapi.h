#pragma once
// The description of the HTTP interface for programs: OpenAPI 3.1, one path for each row of the
// module's table and one for each route of the server's own that has a summary.

#include <span>
#include <string>

#include "arbory/server/service/routes.h"
#include "nas/webapi/module.h"

namespace arbory {

// One line of JSON.
std::string OpenApiText(const nas::Module& module, std::span<const Route> routes,
                        const std::string& cookie);

}  // namespace arbory
