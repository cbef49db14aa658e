#pragma once
// What is said of a search that found nothing: where it looked, which term is in the way, and which
// names come near.

#include <json/value.h>

#include <chrono>
#include <optional>

#include "nas/search/near_misses.h"

namespace arbory {

// Asks the engine itself, in this process, which must have the user's identity and ends soon, what
// a search of these parameters (search_request.h) came close to, and takes `most` for it. Nothing
// where no folder can be opened. Throws for parameters that a search would not take.
std::optional<nas::NearMisses> NearMissesOf(const Json::Value& params,
                                            std::chrono::milliseconds most);

// The same on standard error. Says less where something fails.
void ExplainNothing(const Json::Value& params, std::chrono::milliseconds most);

}  // namespace arbory
