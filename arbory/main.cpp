// The `arbory` program: reads its command line and hands each command its options.

#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <charconv>
#include <exception>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include "arbory/call_command.h"
#include "arbory/command_line.h"
#include "arbory/command_tree.h"
#include "arbory/find_command.h"
#include "arbory/fleet_command.h"
#include "arbory/generate_command.h"
#include "arbory/index_command.h"
#include "arbory/options.h"
#include "arbory/output_options.h"
#include "arbory/search_command.h"
#include "arbory/serve_command.h"
#include "arbory/terminal.h"
#include "arbory/why_command.h"
#include "nas/search/index_question.h"
#include "nas/search/name_source.h"

namespace arbory {
namespace {

// Lines of these texts fit a terminal of 80 columns.
constexpr char kProgramHelp[] =
    "Searches read the folders themselves, or ask the index where its daemon runs,\n"
    "with the same results. The server shows a page to search on.\n"
    "\n"
    "Configuration: the file given with --config, else $ARBORY_CONFIG, else\n"
    "/etc/arbory/arbory.toml, else $XDG_CONFIG_HOME/arbory/arbory.toml. None is\n"
    "needed.\n";

constexpr char kSearchHelp[] =
    "\n"
    "COLUMN is name, path, size, type, user, group, mode, mtime, atime, ctime or\n"
    "crtime.\n"
    "\n"
    "In COMMAND and TEXT {} is the path, {/} the name, {//} the folder, {.} and {/.}\n"
    "path and name without the last extension; {{ and }} are braces. A COMMAND\n"
    "without any gets the path at its end. No shell reads it, and it ends at a ; of\n"
    "its own.\n"
    "\n"
    "Exit status: 0 found, 1 nothing found or a command failed, 2 error, 130\n"
    "interrupted.\n"
    "\n"
    "Examples:\n"
    "  arbory search '*.conf' /etc\n"
    "  arbory search holiday ~/photos -t image --mtime-from 2026-07-01 -l\n"
    "  arbory search '' . --size-from 1G --sort size --desc --limit 10\n"
    "  arbory search 'error code' /var/log --content\n"
    "  arbory search ext:tif -x convert {} {.}.png\n";

constexpr char kCallHelp[] =
    "JSON is an object of parameters. Prints {\"code\":N,\"data\":...} in one line.\n"
    "\n"
    "Exit status: 0 for code 0, 1 for any other code, 2 when no call was made.\n"
    "\n"
    "Example:\n"
    "  arbory call NUVA.Arbory.Search 2 start \\\n"
    "    '{\"folder_path\": \"/photo\", \"pattern\": \"*.jpg\"}'\n";

constexpr char kServeHelp[] =
    "As an ordinary user it serves that user and prints an address to open; it works\n"
    "once, and SIGHUP prints another. As root people log in with their own accounts,\n"
    "unless --user names the one user to serve. SIGTERM and SIGINT stop it.\n"
    "\n"
    "Examples:\n"
    "  arbory serve --share photos=$HOME/Pictures\n"
    "  arbory serve --config /etc/arbory/arbory.toml --listen 192.168.1.2:8750\n";

constexpr char kWhyHelp[] =
    "For a search that does not find what it should: put \"why FILE\" in the place of\n"
    "\"search\". All its options are taken; those on output make no difference.\n"
    "\n"
    "Exit status: 0 FILE matches, 1 it is left out, 2 error.\n"
    "\n"
    "Examples:\n"
    "  arbory why ~/photos/IMG_1.jpg holiday ~/photos -t image\n"
    "  arbory why /var/log/syslog 'error code' /var/log --content\n";

constexpr char kFindHelp[] =
    "The best first: names that begin with the words, whole words, little depth,\n"
    "the newest. Only the index is asked (arbory index): nothing is walked or stored.\n"
    "WORDS are a pattern of arbory search, whose help tells of SIZE and TIME as well.\n"
    "Without WORDS, on a terminal, the program fzf shows what is found while you\n"
    "type, and the path that you choose is printed.\n"
    "\n"
    "Exit status: 0 found, 1 nothing found, 2 error or no index, 130 interrupted.\n"
    "\n"
    "Examples:\n"
    "  arbory find holiday ext:jpg\n"
    "  arbory find plan --in ~/documents --mtime-from last-7-days -l\n"
    "  vi \"$(arbory find)\"\n";

constexpr char kIndexHelp[] =
    "Keeps the names of all shares and volumes in mind, so that searches need not\n"
    "read the folders, and answers until SIGTERM or SIGINT. As root for everybody,\n"
    "each with what they may see; as an ordinary user over what that user may read.\n"
    "The other forms ask the daemon that runs.\n"
    "\n"
    "Exit status: --status 0 all is current, 1 not yet, 2 no daemon; --check 0 no\n"
    "difference, 1 some, 2 it could not be done.\n";

constexpr char kFleetHelp[] =
    "A front searches boxes. key makes what they know it by; config and status read\n"
    "the file that names them, as in /etc/arbory/fleet.toml. How a fleet is set up\n"
    "stands in docs/fleet.md.\n"
    "\n"
    "Exit status: 0 done, 1 for status where a box does not answer, 2 error.\n";

// Help without the parser's own notes on which options need or exclude each other.
class Formatter : public CLI::Formatter {
 public:
  std::string make_option_opts(const CLI::Option* option) const override {
    const std::string type = ValueName(option);
    const bool list = option->get_positional() && option->get_items_expected_max() > 1;
    return (type.empty() || option->get_positional() ? "" : " " + type) + (list ? " ..." : "");
  }
};

void DefineCall(CLI::App* call, CallOptions* options) {
  call->add_option("API", options->api, "Name of the API")->required();
  const CLI::Validator number(
      [](const std::string& text) {
        int version = 0;
        const char* const end = text.data() + text.size();
        const auto read = std::from_chars(text.data(), end, version);
        if (read.ec == std::errc() && read.ptr == end) return std::string();
        return "'" + text + "' is not a number";
      },
      "");
  call->add_option("VERSION", options->version, "Version of the API")->required()->check(number);
  call->add_option("METHOD", options->method, "Method of the API")->required();
  call->add_option("JSON", options->params, "Parameters");
  AddCommonOptions(call, &options->common);
  call->footer(kCallHelp);
}

void DefineServe(CLI::App* serve, ServeOptions* options) {
  serve->add_option("--listen", options->listen, "Address to listen on; 127.0.0.1:8750 by default")
      ->type_name("HOST:PORT");
  serve->add_option("--fleet", options->fleet, "Search the machines too that this file names")
      ->type_name("FILE");
  AddCommonOptions(serve, &options->common);
  serve->footer(kServeHelp);
}

void DefineFleet(CLI::App* fleet, FleetOptions* options) {
  fleet->require_subcommand(1);
  fleet->footer(kFleetHelp);
  CLI::App* key = fleet->add_subcommand("key", "Make a front's keys and print the public one");
  key->add_option("FILE", options->key_file, "A new file for the secret one")->required();
  CLI::App* config = fleet->add_subcommand("config", "Print the configuration of HAProxy");
  CLI::Option* write =
      config->add_option("--write", options->write, "Write it there, where it has changed")
          ->type_name("PATH");
  config->add_option("--reload", options->reload, "And run this then: 'systemctl reload haproxy'")
      ->type_name("COMMAND")
      ->needs(write);
  CLI::App* status = fleet->add_subcommand("status", "Tell of every box how it is");
  for (CLI::App* command : {config, status}) {
    command->add_option("FILE", options->file, "The file that names the boxes")->required();
  }
}

int RunFleet(const CLI::App& fleet, const FleetOptions& options) {
  if (fleet.got_subcommand("key")) return RunFleetKeyCommand(options);
  if (fleet.got_subcommand("config")) return RunFleetConfigCommand(options);
  return RunFleetStatusCommand(options);
}

constexpr int kMostThreads = static_cast<int>(nas::NameSource::kMostThreads);

// An empty `group` leaves them out of the help.
void AddOutput(CLI::App* search, SearchOptions* options, const char* group) {
  search->option_defaults()->group(group);
  CLI::Option* sort =
      search->add_option("--sort", options->sort_by, "Print sorted, when the search has finished")
          ->type_name("COLUMN")
          ->check(OneOf({"name", "path", "size", "type", "user", "group", "mode", "mtime", "atime",
                         "ctime", "crtime"}));
  search->add_flag("--desc", options->descending, "Largest, latest or last first")->needs(sort);
  AddSearchOutput(search, options);
  search->add_flag("--show-errors", options->common.show_errors,
                   "Name the folders that could not be read, and say why");
  search->add_option("--threads", options->common.threads, "Walk with N threads")
      ->type_name("N")
      ->check(CLI::Validator(
          [](const std::string& text) {
            return CLI::Range(1, kMostThreads)(text).empty()
                       ? std::string()
                       : "'" + text + "' is not a number from 1 to " + std::to_string(kMostThreads);
          },
          ""));
  search->add_flag("-v,--verbose", options->verbose, "Say how the search was answered");
  const std::map<std::string, nas::IndexUse> uses = {{"auto", nas::IndexUse::kAuto},
                                                     {"always", nas::IndexUse::kAlways},
                                                     {"never", nas::IndexUse::kNever}};
  search
      ->add_option("--index", options->common.index_use,
                   "auto: where it is current; always: or fail; never: walk")
      ->type_name("WHEN")
      ->transform(CLI::Transformer(uses).description(""))
      ->transform(OneOf({"auto", "always", "never"}));
}

void DefineSearch(CLI::App* search, SearchOptions* options) {
  AddQueryOptions(search, &options->query);
  AddOutput(search, options, "Output");
  search->option_defaults()->group("Where and as whom");
  search
      ->add_option("--fleet", options->fleet,
                   "Search the machines it names; a FOLDER is /BOX/SHARE")
      ->type_name("FILE");
  AddCommonOptions(search, &options->common);
  search->footer(std::string(kQueryHelp) + kSearchHelp);
}

void DefineFind(CLI::App* find, FindOptions* options) {
  AddFindQuery(find, options);
  find->option_defaults()->group("Output");
  const CLI::Validator count(
      [](const std::string& text) {
        size_t number = 0;
        const auto [end, failed] = std::from_chars(text.data(), text.data() + text.size(), number);
        const bool whole = failed == std::errc() && end == text.data() + text.size();
        if (whole && number > 0 && number <= nas::kMostBest) return std::string();
        return "'" + text + "' is no number from 1 to " + std::to_string(nas::kMostBest) +
               "; arbory search lists all";
      },
      "");
  find->add_option("--limit", options->limit, "Print at most N files; 100 by default")
      ->type_name("N")
      ->check(count);
  AddFormat(find, &options->output);
  find->add_flag("--choices", options->choices)->group("");
  find->option_defaults()->group("Where and as whom");
  find->add_option("--in", options->query.folders, "Look there, not in all shares and volumes")
      ->type_name("FOLDER")
      ->allow_extra_args(false);
  AddCommonOptions(find, &options->common);
  find->footer(kFindHelp);
}

void DefineWhy(CLI::App* why, WhyOptions* options) {
  why->add_option("FILE", options->file, "The file, or folder, that it should find")->required();
  AddQueryOptions(why, &options->search.query);
  AddOutput(why, &options->search, "");
  why->option_defaults()->group("Where and as whom");
  AddCommonOptions(why, &options->search.common);
  why->footer(std::string(kQueryHelp) + "\n" + kWhyHelp);
}

void DefineIndex(CLI::App* index, IndexOptions* options) {
  CLI::Option* status = index->add_flag("--status", options->status, "Tell what the daemon does");
  index->add_flag("--json", options->json, "The same as JSON")->needs(status);
  CLI::Option* rebuild =
      index->add_flag("--rebuild", options->rebuild, "Have everything read anew")->excludes(status);
  index->add_flag("--check", options->check, "Print how the index differs from the folders")
      ->excludes(status)
      ->excludes(rebuild);
  AddCommonOptions(index, &options->common);
  index->footer(kIndexHelp);
}

void DefineGenerate(CLI::App* generate, GenerateOptions* options) {
  generate->add_option("FOLDER", options->folder, "Where to")->required();
  generate->add_option("DATE", options->date, "Of the manual: 2026-01-31")->required();
  generate->add_option("SAMPLE", options->sample, "The configuration file's")->required();
}

// Of the program, whatever the command.
void AddVersion(CLI::App* app) {
  app->set_version_flag("-V,--version", std::string("arbory ") + ARBORY_VERSION,
                        "Print the version")
      ->group(app->get_help_ptr()->get_group());
  for (CLI::App* command : app->get_subcommands({})) AddVersion(command);
}

std::string Explain(const CLI::App& app, const CLI::ParseError& error, const char* first_word) {
  if (first_word == nullptr) return "give a command; see arbory --help";
  const auto chosen = app.get_subcommands();
  if (chosen.empty() || chosen.front()->get_name() != first_word) {
    return "'" + std::string(first_word) + "' is no command; see arbory --help";
  }
  const auto left = chosen.front()->remaining();
  const std::string command = chosen.front()->get_name();
  std::string text = error.what();
  if (chosen.front()->get_require_subcommand_min() > 0) text = "say what " + command + " is to do";
  if (!left.empty()) {
    text = "not understood: " + Unmarked(left.front());
    if (left.front().starts_with('-')) text += " (put -- before a pattern that begins with -)";
  }
  return text + "; see arbory " + command + " --help";
}

int RunSearch(SearchOptions* options) {
  options->query.content |= options->output.lines;
  if (options->output.quiet) options->limit = 1;
  return RunSearchCommand(*options);
}

struct Options {
  CallOptions call;
  ServeOptions serve;
  FleetOptions fleet;
  IndexOptions index;
  SearchOptions search;
  FindOptions find;
  WhyOptions why;
  GenerateOptions generate;
};

struct Command {
  std::string_view name;
  const char* description;
  void (*define)(CLI::App* command, Options* options);  // of one that was added by its name
  int (*run)(CLI::App* command, Options* options);
};

// For whoever builds the program, so no part of the help. Tells of all options.
constexpr char kGenerate[] = "generate";

constexpr Command kCommands[] = {
    {"call", "Make one API call and print its reply",
     [](CLI::App* command, Options* options) { DefineCall(command, &options->call); },
     [](CLI::App*, Options* options) { return RunCallCommand(options->call); }},
    {"serve", "Serve the search page and the API over HTTP",
     [](CLI::App* command, Options* options) { DefineServe(command, &options->serve); },
     [](CLI::App*, Options* options) { return RunServeCommand(options->serve); }},
    {"fleet", "Look after a fleet of machines",
     [](CLI::App* command, Options* options) { DefineFleet(command, &options->fleet); },
     [](CLI::App* command, Options* options) { return RunFleet(*command, options->fleet); }},
    {"index", "Keep an index of names, so that searches are quick",
     [](CLI::App* command, Options* options) { DefineIndex(command, &options->index); },
     [](CLI::App*, Options* options) { return RunIndexCommand(options->index); }},
    {"search", "Search folders and print what is found",
     [](CLI::App* command, Options* options) { DefineSearch(command, &options->search); },
     [](CLI::App*, Options* options) { return RunSearch(&options->search); }},
    {"find", "Print the best matches that the index knows",
     [](CLI::App* command, Options* options) { DefineFind(command, &options->find); },
     [](CLI::App*, Options* options) { return RunFindCommand(options->find); }},
    {"why", "Tell why a search does not find a file",
     [](CLI::App* command, Options* options) { DefineWhy(command, &options->why); },
     [](CLI::App*, Options* options) { return RunWhyCommand(options->why); }},
    {kGenerate, "Write the manual and the completions",
     [](CLI::App* command, Options* options) { DefineGenerate(command, &options->generate); },
     [](CLI::App* command, Options* options) {
       return RunGenerateCommand(options->generate, Describe(command->get_parent()));
     }},
};

int Run(int argc, char** argv) {
  constexpr size_t kHelpColumn = 24;  // where descriptions begin
  CLI::App app("Searches folders by name, attributes and contents.", "arbory");
  const auto formatter = std::make_shared<Formatter>();
  formatter->column_width(kHelpColumn);
  app.formatter(formatter);
  app.require_subcommand(1);
  app.footer(kProgramHelp);
  Options options;
  options.find.arguments.assign(argv + std::min(argc, 1), argv + argc);
  // To define the options of all takes as long as a short search.
  const std::string_view first = argc > 1 ? argv[1] : "";
  for (const Command& command : kCommands) {
    CLI::App* added = app.add_subcommand(std::string(command.name), command.description);
    if (command.name == first || first == kGenerate) command.define(added, &options);
  }
  app.get_subcommand(kGenerate)->group("");
  AddVersion(&app);
  UnmarkValues(&app);
  try {
    app.parse(MarkedArguments(argc, argv));
  } catch (const CLI::Success& asked) {
    std::ostringstream text;
    app.exit(asked, text);
    Print(text.str());
    return kExitSuccess;
  } catch (const CLI::ParseError& error) {
    throw UsageError(Explain(app, error, argc > 1 ? argv[1] : nullptr));
  }
  CLI::App* chosen = app.get_subcommands().front();
  return std::ranges::find(kCommands, chosen->get_name(), &Command::name)->run(chosen, &options);
}

// Libraries end the process in places where they have no memory, or have an error of their own.
[[noreturn]] void EndWithWords() {
  WriteOut(STDERR_FILENO, "arbory: out of memory, or an error in the program\n");
  _exit(kExitError);
}

}  // namespace
}  // namespace arbory

int main(int argc, char** argv) {
  std::set_terminate(arbory::EndWithWords);
  arbory::FillStandardDescriptors();
  try {
    try {
      return arbory::Run(argc, argv);
    } catch (const std::exception& error) {
      arbory::Complain(error.what());
    }
  } catch (...) {
    // There was no memory even for that sentence.
    arbory::WriteOut(STDERR_FILENO, "arbory: out of memory\n");
  }
  return arbory::kExitError;
}
