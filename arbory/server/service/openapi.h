#pragma once
// The description of the HTTP interface for programs: OpenAPI 3.1, one path for each row of the
// module's table and one for each route of the server's own.

#include <string>

#include "nas/webapi/runner.h"

namespace arbory {

std::string OpenApiText(const nas::Module& module);

}  // namespace arbory
