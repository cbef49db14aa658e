#pragma once
// The index daemon's figures among the server's metrics.

#include <json/value.h>

#include <string>

namespace arbory {

// In the Prometheus text format; empty where no daemon answers at once.
std::string IndexMetrics();

// How many names the index knows and, in its words, how it is, as "names" and "index"; nothing is
// added where no daemon answers.
void AddIndexState(Json::Value* body);

}  // namespace arbory
