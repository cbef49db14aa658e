#include "arbory/command_line.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <charconv>
#include <cstdint>

#include "arbory/output_options.h"

namespace arbory {
namespace {

// Not to be typed by accident, and no beginning of an option.
constexpr char kMarked[] = "\x1f[";

void AddTimes(CLI::App* command, const std::string& name, const std::string& verb,
              TimeRange* range) {
  command->add_option("--" + name + "-from", range->from, verb + " then or later")
      ->type_name("TIME");
  command->add_option("--" + name + "-to", range->to, verb + " then or earlier")->type_name("TIME");
}

// The last one given counts, so that an alias can be overruled.
void AddLetters(CLI::App* command, SearchQuery* query) {
  const auto add = [&](const char* names, const char* word, const char* what) {
    command
        ->add_flag_function(
            names, [query, word](std::int64_t) { query->letters = word; }, what)
        ->trigger_on_parse();
  };
  add("-s,--case-sensitive", "exact", "Letter case and accents count");
  add("--smart-case", "smart", "They count in a word that has a capital letter");
  add("-i,--ignore-case", "any", "They do not; as usual");
}

// What is off as usual, and what turns it off again, as other programs have it on.
void AddSwitch(CLI::App* command, bool* value, const char* on, const char* what, const char* off) {
  const auto add = [&](const char* names, bool given, const char* description) {
    command
        ->add_flag_function(
            names, [value, given](std::int64_t) { *value = given; }, description)
        ->trigger_on_parse();
  };
  add(on, true, what);
  add(off, false, "Do not; as usual");
}

// Where the search goes.
void AddScope(CLI::App* command, SearchQuery* query) {
  const CLI::Validator levels = NumberOf("levels");
  command->add_option("-d,--max-depth", query->max_depth, "At most N levels down; 1: in FOLDER")
      ->type_name("N")
      ->check(levels);
  command->add_option("--min-depth", query->min_depth, "At least N levels down")
      ->type_name("N")
      ->check(levels);
  command
      ->add_option("-E,--exclude", query->excludes, "Leave out such names, and all in such folders")
      ->type_name("GLOB")
      ->allow_extra_args(false);
  AddSwitch(command, &query->no_hidden, "--no-hidden", "Leave out what begins with a dot",
            "-H,--hidden");
  AddSwitch(command, &query->ignore_files, "--ignore-files",
            "Leave out what .gitignore, .ignore and .fdignore say", "-I,--no-ignore");
  command->add_flag("--one-file-system", query->one_file_system,
                    "Do not enter what is mounted from another file system");
  AddLetters(command, query);
  command
      ->add_flag_function("-L,--follow",
                          [](std::int64_t) {
                            throw UsageError(
                                "symbolic links are found and not followed, as they may lead out "
                                "of what is searched; name the folder that one leads to");
                          })
      ->group("");
}

void AddCriteria(CLI::App* command, SearchQuery* query) {
  command->option_defaults()->group("Criteria");
  command->add_option("-e,--extension", query->extensions, "Extensions: jpg, or jpg,png")
      ->type_name("EXT")
      ->allow_extra_args(false);
  // For who completes it; what else it may be, or several, the search tells.
  const CLI::Validator types([](const std::string&) { return std::string(); },
                             "{file,dir,link,executable,empty,pipe,socket,block,char,image,video,"
                             "audio,document,archive}");
  command->add_option("-t,--type", query->types, "Types: f or file, or several: d,l")
      ->type_name("TYPE")
      ->check(types)
      ->allow_extra_args(false);
  command->add_option("--size-from", query->size_from, "At least this large")->type_name("SIZE");
  command->add_option("--size-to", query->size_to, "At most this large")->type_name("SIZE");
  AddTimes(command, "mtime", "Modified", &query->mtime);
  AddTimes(command, "crtime", "Created", &query->crtime);
  AddTimes(command, "atime", "Last read", &query->atime);
  command->add_option("--owner", query->owner, "Owned by this user")->type_name("USER");
  command->add_option("--group", query->group, "Of this group")->type_name("GROUP");
  AddScope(command, query);
  command->add_flag_function(
      "--no-recursive", [query](std::int64_t) { query->recursive = false; },
      "Do not enter the folders in FOLDER");
  command->add_flag("--content", query->content, "Also files whose contents hold the pattern");
}

}  // namespace

const char kQueryHelp[] =
    "PATTERN is compared with names, letter case and accents ignored: a word matches\n"
    "anywhere in the name, with *, ?, [ ] or {a,b} the whole name, with / the path.\n"
    "Several words must all match; a|b is either, !a is not, <a b> a group, \"a b\" one\n"
    "word, regex: begins a regular expression and '' is every name. ext:jpg,png\n"
    "type:image size:>1GB modified:last-7-days owner:ann depth:<3 empty: content:word\n"
    "case:Word ask for more than a name. A -- ends the options.\n"
    "\n"
    "TYPE is f (file), d (dir), l (link), x (executable), e (empty), p (pipe),\n"
    "s (socket), b or c (device), image, video, audio, document or archive.\n"
    "\n"
    "SIZE is bytes, or 10k, 5M, 1.5G (1024-based). TIME is 2026-01-31, 2026-07,\n"
    "yesterday, last-7-days, 2026-01-31T12:00, an age such as 30m, 12h or 7d, or\n"
    "seconds since 1970. Bounds are inclusive; a date alone means the whole day.\n";

std::vector<std::string> MarkedArguments(int argc, char** argv) {
  std::vector<std::string> arguments(argv + std::min(argc, 1), argv + argc);
  JoinCommands(&arguments);
  for (std::string& argument : arguments) {
    // "--option=[" and "-o[" as well.
    const size_t begin = argument.find('[');
    const bool begins_value = begin == 0 || argument.starts_with('-');
    if (begin != std::string::npos && begins_value) argument.replace(begin, 1, kMarked);
  }
  std::ranges::reverse(arguments);  // as the parser wants them
  return arguments;
}

std::string Unmarked(std::string text) {
  const size_t mark = text.find(kMarked);
  if (mark != std::string::npos) text.erase(mark, 1);
  return text;
}

void UnmarkValues(CLI::App* app) {
  const CLI::Validator unmark(
      [](std::string& value) {
        value = Unmarked(std::move(value));
        return std::string();
      },
      "");
  for (CLI::Option* option :
       app->get_options([](CLI::Option* each) { return each->get_items_expected_max() > 0; })) {
    option->transform(unmark);  // before all checks
  }
  for (CLI::App* command : app->get_subcommands({})) UnmarkValues(command);
}

CLI::Validator NumberOf(const char* what) {
  return {[what](const std::string& text) {
            std::int64_t number = 0;
            const char* const end = text.data() + text.size();
            const auto read = std::from_chars(text.data(), end, number);
            const bool whole = read.ec == std::errc() && read.ptr == end && number >= 0;
            return whole ? std::string() : "'" + text + "' is not a number of " + what;
          },
          ""};
}

CLI::Validator OneOf(std::vector<std::string> words) {
  std::string list;
  for (const std::string& word : words) list += (list.empty() ? "" : ",") + word;
  const auto check = [words = std::move(words)](std::string& text) {
    const std::string lower = CLI::detail::to_lower(text);
    if (std::ranges::find(words, lower) != words.end()) {
      text = lower;
      return std::string();
    }
    std::string sentence = "'" + text + "' is none of ";
    for (const std::string& word : words) {
      if (&word != &words.front()) sentence += &word == &words.back() ? " and " : ", ";
      sentence += word;
    }
    return sentence;
  };
  return {check, "{" + list + "}"};
}

void AddCommonOptions(CLI::App* command, CommonOptions* common) {
  command->add_option("--user", common->user, "Act for this user (root only)")->type_name("USER");
  command->add_option("--share", common->shares, "Offer the directory as a share, for this run")
      ->type_name("NAME=DIR")
      ->allow_extra_args(false);
  command->add_option("--config", common->config, "Configuration file")->type_name("FILE");
}

void AddQueryOptions(CLI::App* command, SearchQuery* query) {
  command->add_option("PATTERN", query->pattern, "What to look for")->required();
  command->add_option("FOLDER", query->folders, "Folders to search; the current one by default");
  AddCriteria(command, query);
  command->final_callback([query] {
    query->here = query->folders.empty();
    if (query->here) query->folders = {"."};
  });
}

void AddFindQuery(CLI::App* command, FindOptions* find) {
  command->add_option("WORDS", find->words, "What to look for");
  AddCriteria(command, &find->query);
  command->get_option("--content")->group("");  // refused with a sentence
  command->final_callback([find] {
    for (const std::string& word : find->words) {
      find->query.pattern += (&word == &find->words.front() ? "" : " ") + word;
    }
  });
}

}  // namespace arbory
