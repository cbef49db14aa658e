#pragma once
// Choosing among what `arbory find` finds while its words are typed. The list, the keys and the
// drawing are fzf's, a program of its own; it has the words looked for by running `arbory find`
// again, and hands back the line that was chosen.

#include <string>
#include <string_view>
#include <vector>

namespace arbory {

struct PickerSettings {
  std::vector<std::string> arguments;  // of this program, without words; --choices is added
  std::string first;  // the choices (rows.h) that are shown before anything is typed
  char end = '\n';    // of each path that is printed
};

// Prints the path that was chosen; returns the exit code. Throws UsageError where there is no fzf.
int RunPicker(const PickerSettings& settings);

// The shell's command that runs the program at `program` with these arguments, the choices of fzf's
// query for its words. Whatever the arguments hold, neither the shell nor fzf reads more into them.
std::string ChoicesCommand(const std::string& program, const std::vector<std::string>& arguments);

}  // namespace arbory
