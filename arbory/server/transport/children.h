#pragma once
// The child processes of this one, as the system knows them.

#include <sys/types.h>

#include <vector>

namespace arbory {

std::vector<pid_t> ChildrenOfThisProcess();

}  // namespace arbory
