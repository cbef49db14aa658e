#pragma once
// Manual pages, in the man(7) macros.

#include <string>
#include <vector>

#include "arbory/command_tree.h"

namespace arbory {

struct ManualPage {
  std::string name;  // "arbory-search"
  char section;      // '1' a user's command, '8' an administrator's, '5' a file
  std::string text;
};

// One of the program and one of each command. `date` is year-month-day.
std::vector<ManualPage> ManualPages(const ProgramText& program, const std::string& version,
                                    const std::string& date);

// That of the configuration file, from the sample with all keys: "# key = default  # what it is",
// below "[table]" lines. A comment that stands alone and ends with a full stop is a paragraph; one
// that begins behind the others goes on with the line before. Empty where there are no keys.
ManualPage ConfigurationPage(const std::string& sample, const std::string& version,
                             const std::string& date);

}  // namespace arbory
