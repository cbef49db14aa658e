#pragma once
// The options that several commands share, and words of the command line as they were typed.

#include <string>
#include <vector>

#include "arbory/options.h"

namespace CLI {
class App;
class Validator;
}  // namespace CLI

namespace arbory {

// A value that begins with "[" is a folder's name, a pattern or an address here, and a list of
// values to the option parser. The first function takes the words of main, the program's own left
// out, marks those and returns all in reverse, as the parser wants them; the second takes a mark
// off again, and the third has it done to all values of `app` and its commands, once all are
// defined.
std::vector<std::string> MarkedArguments(int argc, char** argv);
std::string Unmarked(std::string text);
void UnmarkValues(CLI::App* app);

// Refuses what is not digits alone, or too large, as no number of `what`, which has to live on.
CLI::Validator NumberOf(const char* what);

// Refuses what is none of `words`, and takes their letter case as here.
CLI::Validator OneOf(std::vector<std::string> words);

// --user, --share and --config, in the current group of `command`.
void AddCommonOptions(CLI::App* command, CommonOptions* common);

// PATTERN, FOLDER and the criteria in a group of their own. When the command has been parsed,
// `query` holds the current folder where none was given; before, it must not be read. `query` must
// live as long as `command`.
void AddQueryOptions(CLI::App* command, SearchQuery* query);

// WORDS, --in and the criteria, in the same way: the query's pattern is the words then, and it has
// no folder where none was given.
void AddFindQuery(CLI::App* command, FindOptions* find);

// What PATTERN, SIZE and TIME may be; lines that fit a terminal of 80 columns.
extern const char kQueryHelp[];

}  // namespace arbory
