#pragma once
// Searches that a front asks for: begun, and their first rows told, in one call, and further rows
// in further ones (nas/fleet/question.h has the bodies). Children of the kind of user_calls.h.
//
// A search of a front is a task of the user's like any other, with a worker and a result database,
// but for what people's searches leave in their history. It has a lease: a front that goes without
// a word leaves nothing. With its last row told it is removed.

#include <string>

#include "nas/webapi/runner.h"

namespace arbory {

nas::Child StartFleetSearch(const std::string& front, const nas::ApiCall& call);
// Parameters "task", and of the page. 404 when there is no such search.
nas::Child StartFleetRows(const nas::ApiCall& call);

}  // namespace arbory
