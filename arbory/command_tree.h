#pragma once
// The command line as plain values: what its manual pages and completions are made of. All of it is
// taken from the parser's own definition, so an option that is added there is told of everywhere.

#include <string>
#include <vector>

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace arbory {

struct OptionText {
  std::vector<std::string> names;    // "-e", "--extension"; of an operand "FOLDER" alone
  std::string value;                 // what follows it: "EXT"; empty where nothing does
  std::vector<std::string> choices;  // what the value may be, where that is known
  std::string description;
  std::string group;  // the heading it stands under
  bool required = false;
  bool many = false;  // of an operand: may be given several times
};

struct CommandText {
  std::string name;     // "search"; of the program itself "arbory"
  std::string summary;  // one line
  std::vector<OptionText> options;
  std::vector<OptionText> operands;
  std::string prose;  // what the help says below its options
};

struct ProgramText {
  CommandText program;
  std::vector<CommandText> commands;
};

// What the value of an option is called: "COLUMN", without the list of what it may be.
std::string ValueName(const CLI::Option* option);

// Without what the help leaves out. A command that has commands of its own takes the name of one,
// and what they take.
ProgramText Describe(CLI::App* program);

}  // namespace arbory
