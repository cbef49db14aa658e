#pragma once
// See FleetLibrary.

#include <string>

#include "nas/fleet/library.h"

namespace nas {

FleetClient* NewFleetClient(const std::string& socket, size_t most_bytes);

}  // namespace nas
