#pragma once
// The options that say what is done with what is found.

#include <string>
#include <vector>

#include "arbory/options.h"

namespace CLI {
class App;
}

namespace arbory {

// -l, --json, -0, --format, --color, -x, -X and -j, in the current group.
void AddFormat(CLI::App* command, OutputOptions* output);

// The same, and those of a search alone.
void AddSearchOutput(CLI::App* command, SearchOptions* options);

// What follows -x or -X up to ";" is a command and no option of this program: makes one word of it
// that the parser leaves alone. `words` are those of main, the program's own left out.
void JoinCommands(std::vector<std::string>* words);

}  // namespace arbory
