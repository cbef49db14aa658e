#include "arbory/output_options.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <map>

#include "arbory/command_line.h"

namespace arbory {
namespace {

// Ends each word of a joined command: the one byte that no word holds.
constexpr char kWordEnd = '\0';

// A command as JoinCommands leaves it, or a single word.
std::vector<std::string> WordsOf(const std::string& text, const char* option) {
  std::vector<std::string> words;
  for (size_t at = 0; at < text.size();) {
    const size_t end = std::min(text.find(kWordEnd, at), text.size());
    words.push_back(text.substr(at, end - at));
    at = end + 1;
  }
  if (words.empty()) throw UsageError(std::string(option) + " needs a command");
  return words;
}

void AddCommand(CLI::App* command, const char* letter, const char* name,
                std::vector<std::string>* words, const char* description) {
  command
      ->add_option_function<std::string>(
          std::string(letter) + "," + name,
          [=](const std::string& text) { *words = WordsOf(text, name); }, description)
      ->type_name("COMMAND");
}

void AddLines(CLI::App* search, OutputOptions* output) {
  search->add_flag("-n,--line-number", output->lines,
                   "Lines of files found by their contents; means --content");
  const auto add = [&](const char* names, bool before, bool after, const char* description) {
    search
        ->add_option_function<size_t>(
            names,
            [=](size_t lines) {
              output->lines = true;
              if (before) output->before = lines;
              if (after) output->after = lines;
            },
            description)
        ->type_name("N")
        ->check(NumberOf("lines"));
  };
  add("-C,--context", true, true, "As -n, and N lines before and after each");
  add("-B,--before-context", true, false, "As -n, and N lines before each");
  add("-A,--after-context", false, true, "As -n, and N lines after each");
}

}  // namespace

void AddFormat(CLI::App* command, OutputOptions* output) {
  command->add_flag("-l,--long", output->long_format,
                    "Mode, owner, group, size and time of each file");
  command->add_flag("--json", output->json, "One JSON object a line");
  command->add_flag("-0,--print0", output->null_separated, "End each path with a NUL byte");
  command->add_option("--format", output->format, "Print this for each path; see -x for places")
      ->type_name("TEXT");
  const std::map<std::string, ColorUse> uses = {
      {"auto", ColorUse::kAuto}, {"always", ColorUse::kAlways}, {"never", ColorUse::kNever}};
  command->add_option("--color", output->color, "auto: on a terminal; always; never")
      ->type_name("WHEN")
      ->transform(CLI::Transformer(uses).description(""))
      ->transform(OneOf({"auto", "always", "never"}));
  AddCommand(command, "-x", "--exec", &output->exec,
             "Run for each path, several at a time; ends at ;");
  AddCommand(command, "-X", "--exec-batch", &output->exec_batch,
             "Run for all paths together, as many as fit");
  command
      ->add_option("-j,--jobs", output->jobs,
                   "Commands of -x at a time; with 1 they have the input")
      ->type_name("N")
      ->check(NumberOf("commands"));
}

void AddSearchOutput(CLI::App* search, SearchOptions* options) {
  OutputOptions* const output = &options->output;
  search->add_option("--limit,--max-results", options->limit, "Print at most N files")
      ->type_name("N")
      ->check(NumberOf("files"));
  search->add_flag_function(
      "-1", [options](std::int64_t) { options->limit = 1; }, "The same as --limit 1");
  search->add_option("--offset", options->offset, "Leave out the first N files")
      ->type_name("N")
      ->check(NumberOf("files"));
  AddFormat(search, output);
  search->add_flag("-a,--absolute", output->absolute, "Whole paths, as they are on disk");
  search->add_flag("-c,--count", output->count, "Print only how many files are found");
  search->add_flag("-q,--quiet", output->quiet, "Print nothing; the exit status tells");
  AddLines(search, output);
}

void JoinCommands(std::vector<std::string>* words) {
  if (words->empty()) return;
  const std::string& command = words->front();
  if (command != "search" && command != "find" && command != "why") return;
  for (auto word = words->begin(); word != words->end() && *word != "--"; ++word) {
    const bool each = *word == "-x" || *word == "--exec";
    if (!each && *word != "-X" && *word != "--exec-batch") continue;
    const auto begin = word + 1;
    const auto end = std::find(begin, words->end(), ";");
    std::string joined = each ? "--exec=" : "--exec-batch=";
    for (auto part = begin; part != end; ++part) joined += *part + kWordEnd;
    *word = joined;
    words->erase(begin, end == words->end() ? end : end + 1);
  }
}

}  // namespace arbory
