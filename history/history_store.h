#pragma once
// Names and settings of the two stores of past searches that each user has in the preference
// directory. A store is opened, used and closed within one operation of one process. No directory
// is ever made here.

#include <json/value.h>

#include <string>

#include "platform/filedb.h"
#include "platform/webapi.h"

// A parameter as text; empty for an array or object, which have none.
std::string TextOf(const Json::Value& value);

// The store of a kind of search: "advance" has its own, every other kind shares the simple one.
std::string HistoryDBFileName(const std::string& kind);

// Path of the store that the request's "search_type" selects.
std::string HistoryDBPath(const NUVA::APIRequest& request);

// What a store must know before it is written to.
void ConfigureForWriting(NUVA::WEBFM::FileDB& store);
