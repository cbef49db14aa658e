#pragma once
// See FleetLibrary.

#include <string>

#include "nas/fleet/library.h"

namespace nas {

void PrepareFleetClient();
FleetClient* NewFleetClient(const std::string& socket, size_t most_bytes);

}  // namespace nas
