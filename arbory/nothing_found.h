#pragma once
// What is said of a search that found nothing: where it looked, which term is in the way, and which
// names come near.

#include <json/value.h>

#include <chrono>

namespace arbory {

// On standard error, for a search of these parameters (search_request.h). Asks the engine itself,
// in this process, which must have the user's identity and ends soon, and takes `most` for it. Says
// less where something fails.
void ExplainNothing(const Json::Value& params, std::chrono::milliseconds most);

}  // namespace arbory
