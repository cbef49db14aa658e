#pragma once
// Names are bytes, and a reply is text: where the two differ, a row tells its path a second time,
// as the routes of files take it.

#include <json/value.h>

#include "nas/system/child.h"

namespace arbory {

// Gives each of the rows whose "path" is not valid UTF-8 a member "path_encoded": the path with
// everything but "/" and what an address may hold percent-encoded.
void AddAddresses(Json::Value* rows);

// As nas::EncodeJsonReply, with the addresses of a listing's "files".
nas::Reply EncodeWithAddresses(int code, const Json::Value& data);

}  // namespace arbory
