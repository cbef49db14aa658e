#pragma once
// What the command line asked for, as plain values; main.cpp fills them.

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "nas/system/config.h"

namespace arbory {

// The exit codes of all commands.
enum ExitCode : int {
  kExitSuccess = 0,
  kExitNothing = 1,  // no file found; a reply with a code other than 0; a file left out
  kExitError = 2,
  kExitInterrupted = 130,
};

// Something the user can put right. what() is one sentence without a final full stop.
class UsageError : public std::runtime_error {
  using std::runtime_error::runtime_error;
};

// The same of what a search asks for.
class CriterionError : public UsageError {
 public:
  CriterionError(std::string criterion, const std::string& sentence)
      : UsageError(sentence), criterion_(std::move(criterion)) {}
  // The parameter of a search's start that it would have become, of times without its ending.
  const std::string& criterion() const { return criterion_; }

 private:
  std::string criterion_;
};

struct CommonOptions {
  std::string config;               // path; empty: the usual places
  std::string user;                 // empty: the caller
  std::vector<std::string> shares;  // NAME=DIR
  nas::IndexUse index_use = nas::IndexUse::kAuto;
  int threads = 0;           // 0: as many as are of use
  bool show_errors = false;  // name folders that could not be read
};

struct CallOptions {
  CommonOptions common;
  std::string api;
  int version = 0;
  std::string method;
  std::string params;  // JSON text; empty: none
};

struct ServeOptions {
  CommonOptions common;
  std::string listen;  // HOST:PORT; empty: as configured
  std::string fleet;   // the file that names the boxes to ask; empty: none are
};

struct FleetOptions {
  std::string key_file;
  std::string file;    // that names the boxes
  std::string write;   // where the configuration goes; empty: to standard output
  std::string reload;  // a shell command for when it has changed; empty: none
};

struct IndexOptions {
  CommonOptions common;
  // One of these, or none: be the daemon.
  bool status = false;
  bool rebuild = false;
  bool check = false;
  bool json = false;  // of the status
};

// Both bounds are inclusive.
struct TimeRange {
  std::string from;
  std::string to;
  std::string within;  // bounds in one text, as behind "modified:"; in the place of the others
};

// What is searched for and where.
struct SearchQuery {
  std::string pattern;
  std::vector<std::string> folders;
  bool here = false;  // no folder was named, so it is the current one

  std::vector<std::string> extensions;
  std::string type;  // one of the API's
  // Of a command line, where they become terms of the pattern.
  std::vector<std::string> types;
  std::vector<std::string> excludes;
  std::string min_depth;
  std::string max_depth;
  bool no_hidden = false;
  bool ignore_files = false;
  bool one_file_system = false;
  std::string letters;  // "exact", "smart", "any"; empty: the usual
  std::string size_from;
  std::string size_to;
  TimeRange mtime;
  TimeRange crtime;
  TimeRange atime;
  std::string owner;
  std::string group;
  bool recursive = true;
  bool content = false;
};

enum class ColorUse { kAuto, kAlways, kNever };

// What is done with what is found: how it is printed, or what is run for it.
struct OutputOptions {
  bool long_format = false;
  bool json = false;
  bool null_separated = false;
  bool absolute = false;
  bool count = false;
  bool quiet = false;
  std::string format;  // as PathTemplate has it
  ColorUse color = ColorUse::kAuto;
  bool lines = false;  // tell the lines of what matches by its contents
  size_t before = 0;   // lines around them
  size_t after = 0;
  // The words of a command, for each path or for all.
  std::vector<std::string> exec;
  std::vector<std::string> exec_batch;
  size_t jobs = 0;  // commands at a time; 0: as many as processors

  bool runs() const { return !exec.empty() || !exec_batch.empty(); }
};

struct SearchOptions {
  CommonOptions common;
  SearchQuery query;

  std::string sort_by;
  bool descending = false;
  std::uint64_t limit = 0;  // 0: all
  std::uint64_t offset = 0;
  OutputOptions output;
  bool verbose = false;  // say how the search was answered
  std::string fleet;     // the file that names the boxes to ask; empty: none are
};

struct FindOptions {
  static constexpr size_t kUsualLimit = 100;  // what an eye runs over

  CommonOptions common;
  std::vector<std::string> words;
  SearchQuery query;  // its pattern is the words; all shares and volumes where it has no folder
  OutputOptions output;
  size_t limit = kUsualLimit;
  bool choices = false;                // for the picker, which runs the program with it
  std::vector<std::string> arguments;  // all of the command line
};

struct WhyOptions {
  std::string file;
  SearchOptions search;  // whose results FILE is not among
};

struct GenerateOptions {
  std::string folder;
  std::string date;    // year-month-day
  std::string sample;  // the configuration file's sample
};

}  // namespace arbory
