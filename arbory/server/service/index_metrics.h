#pragma once
// The index daemon's figures among the server's metrics.

#include <string>

namespace arbory {

// In the Prometheus text format; empty where no daemon answers at once.
std::string IndexMetrics();

}  // namespace arbory
