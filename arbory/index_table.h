#pragma once
// The daemon's report as a person reads it.

#include <json/value.h>

#include <ctime>
#include <string>

namespace arbory {

// `report` as nas/index/index_report.h has it. Lines for a terminal.
std::string IndexTable(const Json::Value& report, std::time_t now);

}  // namespace arbory
