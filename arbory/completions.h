#pragma once
// Completion of the command line in shells: each function makes the whole script.

#include <string>

#include "arbory/command_tree.h"

namespace arbory {

std::string BashCompletion(const ProgramText& program);
std::string ZshCompletion(const ProgramText& program);
std::string FishCompletion(const ProgramText& program);

}  // namespace arbory
