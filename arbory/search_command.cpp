// The search itself runs in a worker process that outlives every call, so whatever happens here,
// the worker is stopped and what it stored removed before the program ends. For a program that is
// killed another process does both, which waits from where it takes longer than a moment; and
// should that be killed as well, the search has a lease, and ends by itself.

#include "arbory/search_command.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <memory>
#include <optional>
#include <string>

#include "arbory/caller.h"
#include "arbory/interrupt.h"
#include "arbory/nothing_found.h"
#include "arbory/row_reader.h"
#include "arbory/rows.h"
#include "arbory/run_commands.h"
#include "arbory/running_search.h"
#include "arbory/search_request.h"
#include "arbory/search_text.h"
#include "arbory/shown_paths.h"
#include "arbory/terminal.h"
#include "nas/base/unique_fd.h"
#include "nas/results/foreign_accounts.h"
#include "nas/results/result_file.h"
#include "nas/system/identity.h"
#include "nas/tasks/task_files.h"
#include "nas/webapi/runner.h"
#include "platform/task_record.h"

namespace arbory {
namespace {

// Between two looks at a search that had nothing more to show: a part of the time it has run, so
// that first results are seen at once and the asking slows nothing down. It is asked for rows only
// when a look shows that some may have come. The end of the search ends the pause as well.
constexpr std::chrono::milliseconds kLeastPause{3};
constexpr std::chrono::milliseconds kMostPause{100};
constexpr int kPauseShare = 4;
// Asked for this often whatever the looks show: a file system's clock may be too coarse for them.
constexpr std::chrono::milliseconds kMostUnasked{1000};
// A search that lately brought this many rows in one page is looked at all the time: what has been
// found and not yet printed when it ends is what its user waits for.
constexpr std::uint64_t kManyRows = 500;
constexpr std::chrono::milliseconds kLately{300};
// From here on, or before so much is printed at once that a reader may keep it waiting, somebody is
// there to clean up for a program that is killed.
constexpr std::chrono::milliseconds kMoment{100};
constexpr size_t kMomentsText = size_t{32} << 10;  // half of what a pipe holds
// Between two looks at whether the user's other searches leave a place.
constexpr std::chrono::milliseconds kPlacePause{200};
// Saying why nothing was found takes a part of the time that the search took, or that of a small
// tree.
constexpr int kHintShare = 4;
constexpr std::chrono::milliseconds kLeastHint{100};
constexpr std::chrono::milliseconds kMostHint{1000};

// Null for a pattern that asks for no contents.
std::shared_ptr<const RowFormat::Lines> LinesOf(const std::string& text) {
  const auto pattern = nas::Query::Parse(text);
  if (!pattern) return nullptr;
  auto queries = nas::ContentQuery::ForLines(pattern->root());
  return queries.empty() ? nullptr : std::make_shared<const RowFormat::Lines>(std::move(queries));
}

// A path that a program is to be given begins with no "-".
ShownPaths PathsHere(const SearchOptions& options) {
  if (options.output.absolute) return {};
  if (!options.query.here) return ShownPaths(options.query.folders);
  return ShownPaths({options.output.null_separated || options.output.runs() ? "." : ""});
}

ShownPaths PathsFor(const SearchOptions& options) {
  ShownPaths paths = PathsHere(options);
  // What boxes have found begins with the box.
  std::string root = nas::kFleetRoot;
  root.pop_back();
  paths.Show(root, "/");
  return paths;
}

// The options with the boxes of the fleet known, all of them searched where no folder was named.
SearchOptions WithFleet(const SearchOptions& options, Caller* caller) {
  SearchOptions asked = options;
  if (options.fleet.empty()) return asked;
  if (options.output.runs()) {
    throw UsageError("files of other machines cannot be given to a command");
  }
  if (options.output.lines)
    throw UsageError("--line-number shows lines of this machine's files alone");
  nas::FleetSettings fleet = nas::LoadFleet(options.fleet);
  if (faccessat(AT_FDCWD, fleet.key_file.c_str(), R_OK, AT_EACCESS) != 0) {
    throw UsageError("the front's key " + fleet.key_file +
                     " cannot be read: " + std::strerror(errno) + "; search as root, with --user");
  }
  if (asked.query.here) asked.query.folders.clear();
  for (const nas::FleetBox& box : fleet.boxes) {
    if (asked.query.here) asked.query.folders.push_back("/" + box.name);
  }
  asked.query.here = false;
  caller->AskFleet(std::move(fleet));
  return asked;
}

const Json::Value kNoBoxes;

nas::Reply Ignored(int /*code*/, const Json::Value& /*data*/) { return {}; }

enum class Ending { kComplete, kEnough, kInterrupted, kUnwritable, kFailed };

class Search {
 public:
  Search(Caller* caller, const SearchOptions& options)
      : caller_(*caller),
        options_(options),
        started_(Clock::now()),
        format_(FormatOf(options.output)) {
    format_.paths = PathsFor(options);
    if (options.output.lines) format_.lines = LinesOf(options.query.pattern);
    format_.spill = [this](std::string* text) { return Spill(text); };
    if (options.output.runs()) commands_.emplace(options.output);
    if (format_.names_alone() && options.sort_by.empty()) caller->LeaveAttributes();
  }

  int Run(const Json::Value& params) {
    if (!Start(params)) return kExitInterrupted;
    int exit_code = kExitError;
    try {
      exit_code = Report(options_.sort_by.empty() ? Stream() : ListSorted());
    } catch (...) {
      CleanUp();
      throw;
    }
    CleanUp();
    if (found_nothing_ && IsWorthExplaining()) {
      ExplainNothing(params, std::clamp(ran_ / kHintShare, kLeastHint, kMostHint));
    }
    return exit_code;
  }

 private:
  using Clock = std::chrono::steady_clock;

  nas::Reply Call(const char* method, const Json::Value& params, const nas::ReplyEncoder& encode) {
    return caller_.Call(caller_.Method(method), method, params, encode);
  }

  // False where it was interrupted before there was a place for it.
  bool Start(const Json::Value& params) {
    const auto encode = [](int code, const Json::Value& data) {
      return nas::Reply{{.code = code}, code == 0 ? data["taskid"].asString() : ""};
    };
    // An interrupt waits for the search's id, without which the search could not be stopped.
    nas::Reply reply = Call("start", params, encode);
    // Once more where a place may have become free since.
    bool again = true;
    while (reply.head.code != 0 && (AllPlacesTaken() || again)) {
      again = AllPlacesTaken();
      if (!WaitForPlace()) return false;
      reply = Call("start", params, encode);
    }
    if (reply.head.code == 0) {
      task_id_ = reply.body;
      // What is read of the search from here on, a database among it, is its user's to write.
      nas::GiveUpRoot();
      asking_ = AskAfter(caller_.user(), task_id_);
      records_.emplace(caller_.user());
      // Only ever waited for, so it does no harm where the id has come to mean another process.
      worker_.Reset(
          static_cast<int>(syscall(SYS_pidfd_open, ReadSearch(caller_.user(), task_id_).pid, 0)));
      return true;
    }
    if (reply.head.code == nas::kCodeBadRequest) {
      throw std::runtime_error("too many folders for one search");
    }
    const std::string why = WhyNoSearch(caller_);
    throw std::runtime_error("the search cannot be started: " +
                             (why.empty() ? "code " + std::to_string(reply.head.code) : why));
  }

  bool AllPlacesTaken() const {
    const auto places = static_cast<size_t>(nas::CurrentConfig().searches_per_user);
    return UnfinishedSearches(caller_.user()).size() >= places;
  }

  bool WaitForPlace() {
    if (!waited_ && isatty(STDERR_FILENO) != 0) {
      Complain("waiting for one of " + std::to_string(nas::CurrentConfig().searches_per_user) +
               " searches that run for " + caller_.user() + " to end");
    }
    waited_ = true;
    while (AllPlacesTaken()) {
      if (Interrupted() || !Pause(static_cast<int>(kPlacePause.count()), -1)) return false;
    }
    return true;
  }

  // Prints rows as far as they have been found, until there are no more.
  Ending Stream() try {
    std::optional<RowReader> rows;
    while (!rows || !rows->AtEnd()) {
      ShowProgress();
      const RunningSearch state = Look();
      const bool ended = state.all_found || state.finished || !state.exists;
      if (Interrupted()) return Ending::kInterrupted;
      if (!rows && !state.results.empty() && state.exists) {
        rows.emplace(state.results, options_, format_);
      }
      if (rows) {
        const RowReader::Rows found = rows->Next();
        if (!Print(found)) return Interrupted() ? Ending::kInterrupted : Ending::kUnwritable;
        if (!found.caught_up) continue;
        if (found.count >= kManyRows) busy_ = Clock::now();
      }
      if (ended) return rows ? Ending::kComplete : Ending::kFailed;
      Wait();
    }
    return Ending::kEnough;
  } catch (const std::exception& error) {
    failure_text_ = error.what();
    return Ending::kFailed;
  }

  // Prints the rows of the finished search.
  Ending ListSorted() {
    for (RunningSearch state; !state.finished; Wait()) {
      if (Interrupted()) return Ending::kInterrupted;
      state = Look();
      if (!state.exists) return Ending::kFailed;
      if (state.finished) break;
    }
    return Stream();
  }

  // False when standard output does not take it, or no more commands are to be run.
  bool Print(const RowReader::Rows& rows) {
    printed_ += rows.count;
    if (rows.text.empty()) return true;
    progress_.Clear();
    if (commands_ || rows.text.size() > kMomentsText) KeepCleaner();
    errno = 0;
    const bool taken = commands_ ? commands_->Take(rows.text) : WriteOut(STDOUT_FILENO, rows.text);
    if (!taken) failure_ = commands_ ? commands_->failure() : errno;
    return taken;
  }

  bool Spill(std::string* text) {
    progress_.Clear();
    KeepCleaner();
    const bool written = WriteOut(STDOUT_FILENO, *text);
    text->clear();
    return written;
  }

  void Wait() {
    ShowProgress();
    const Clock::time_point now = Clock::now();
    const auto ran = std::chrono::duration_cast<std::chrono::milliseconds>(now - started_);
    if (ran > kMoment) KeepCleaner();
    const auto most = now - busy_ < kLately ? kLeastPause : kMostPause;
    const auto pause = std::clamp(ran / kPauseShare, kLeastPause, most);
    const int records = records_ ? records_->fd() : -1;
    while (Pause(static_cast<int>(pause.count()), worker_.get(), records)) {
      // Without the worker's descriptor only asking tells its end.
      if (!worker_ || !watch_ || watch_->Changed() || Clock::now() - now >= kMostUnasked) break;
      ShowProgress();
    }
  }

  // Rows that come after this are noticed, however early the search is.
  RunningSearch Look() {
    if (records_) records_->Take();
    RunningSearch state = ReadSearch(caller_.user(), task_id_);
    if (!watch_ && !state.results.empty()) watch_.emplace(state.results);
    return state;
  }

  void ShowProgress() {
    if (!progress_.Due()) return;
    const auto ran = std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - started_);
    progress_.Show(ProgressText(ReadSearch(caller_.user(), task_id_), ran.count()));
  }

  // Says what has to be said at the end and returns the exit code.
  int Report(Ending ending) {
    progress_.Clear();
    if (ending == Ending::kInterrupted) return kExitInterrupted;
    const RunningSearch state = ReadSearch(caller_.user(), task_id_);
    // One that has found everything ends by itself.
    running_ = state.exists && !state.finished && !state.all_found;
    if (ending == Ending::kUnwritable) return EndUnwritten(failure_);
    TellOfBoxes(state);
    if (ending != Ending::kEnough && !CameToEnd(ending, state)) return kExitError;
    if (commands_ && !commands_->Finish()) {
      return Interrupted() ? kExitInterrupted : EndUnwritten(commands_->failure());
    }
    if (options_.output.count) arbory::Print(std::to_string(printed_) + "\n");
    if (!options_.output.quiet || printed_ == 0) TellOfSkipped(state);
    if (options_.verbose) Complain("answered " + SourceText(state));
    found_nothing_ = ending == Ending::kComplete && state.exists && state.matches == 0;
    from_index_ = state.source == task_record::kFromIndex;
    ran_ = std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - started_);
    const bool failed = commands_ && !commands_->all_succeeded();
    return printed_ > 0 && !failed ? kExitSuccess : kExitNothing;
  }

  // Without an errno's value it was a command that cannot be run, of which has been told.
  static int EndUnwritten(int failure) {
    // A reader that has seen enough, such as head, is no failure.
    if (failure == EPIPE) return kExitSuccess;
    if (failure == 0) return kExitNothing;
    Complain(CannotPrint(failure));
    return kExitError;
  }

  // What answers at once shall not walk for a script, which reads no advice.
  bool IsWorthExplaining() const {
    if (options_.output.quiet) return false;
    return !from_index_ || isatty(STDERR_FILENO) != 0;
  }

  bool CameToEnd(Ending ending, const RunningSearch& state) {
    const bool walk_refused = options_.common.index_use == nas::IndexUse::kAlways &&
                              !state.source.empty() && state.source != task_record::kFromIndex;
    if (state.progress < 0 && walk_refused) {
      Complain("not answered, as --index always forbids to walk: " + state.index);
    } else if (state.progress < 0) {
      // Why is said of each of them already.
      Complain(NobodyAnswered(state) ? "no box answered"
                                     : FailureSentence(state.error, options_.query.folders));
    } else if (!state.exists || (state.finished && state.progress == 0)) {
      Complain("the search was stopped before it was complete");
    } else if (ending == Ending::kFailed) {
      Complain("the results cannot be read" + (failure_text_.empty() ? "" : ": " + failure_text_));
    } else {
      return true;
    }
    return false;
  }

  static void TellOfSkipped(const RunningSearch& state) {
    for (const RunningSearch::Unread& folder : state.unread_folders) {
      Complain(folder.path + ": " + std::strerror(folder.error_number));
    }
    const auto tell = [](std::uint64_t count, const char* one, const char* many, const char* what) {
      if (count > 0) Complain(Counted(count, one, many) + what);
    };
    tell(state.unreadable, "folder", "folders", " could not be read (permission denied)");
    tell(state.troubled, "folder", "folders",
         " could not be read (errors other than missing permission)");
    tell(state.unreadable_files, "file", "files", " could not be read");
    tell(state.not_text, "file is", "files are", " not text");
  }

  static const Json::Value& FleetOf(const RunningSearch& state) {
    return state.walk.isObject() ? state.walk[task_record::kFleet] : kNoBoxes;
  }

  // A search that asked boxes alone.
  static bool NobodyAnswered(const RunningSearch& state) {
    const Json::Value& fleet = FleetOf(state);
    return fleet.isObject() && fleet["total"].isUInt64() &&
           fleet["total"].asUInt64() == fleet["boxes"].size();
  }

  static void TellOfBoxes(const RunningSearch& state) {
    const Json::Value& fleet = FleetOf(state);
    for (const Json::Value& box : fleet.isObject() ? fleet["boxes"] : kNoBoxes) {
      Complain(box["name"].asString() + ": " + box["state"].asString() + " (" +
               box["why"].asString() + ")");
    }
  }

  Json::Value OfThis() const {
    Json::Value params(Json::objectValue);
    params["taskid"] = task_id_;
    return params;
  }

  void KeepCleaner() {
    if (cleaner_) return;
    cleaner_ = caller_.BeginAtEnd(caller_.Method("clean"), "clean", OfThis(), Ignored);
  }

  // The cleaning goes on by itself: nobody waits for its reply. It is begun here, by a child that
  // has all that is open here: what watches files takes the kernel milliseconds to close, and the
  // last who has it waits for that.
  void CleanUp() {
    if (running_) Call("stop", OfThis(), Ignored);
    caller_.Begin(caller_.Method("clean"), "clean", OfThis(), Ignored);
    if (cleaner_ && cleaner_->pid > 0) kill(cleaner_->pid, SIGKILL);
  }

  Caller& caller_;
  const SearchOptions& options_;
  const Clock::time_point started_;
  RowFormat format_;
  std::optional<CommandRunner> commands_;
  ProgressLine progress_;
  std::string task_id_;
  nas::UniqueFd asking_;               // by it the search knows that this program lives
  std::optional<nas::Child> cleaner_;  // should this program be killed
  nas::UniqueFd worker_;               // its pidfd, invalid where that cannot be had
  std::optional<nas::RecordWatch> records_;
  std::optional<nas::ResultWatch> watch_;
  Clock::time_point busy_{};  // when a page last held many rows
  std::uint64_t printed_ = 0;
  int failure_ = 0;           // of kUnwritable, errno's value
  std::string failure_text_;  // of kFailed
  bool running_ = true;
  bool found_nothing_ = false;
  bool waited_ = false;
  bool from_index_ = false;
  std::chrono::milliseconds ran_{0};
};

}  // namespace

int RunSearchCommand(const SearchOptions& asked) {
  WatchForInterrupt();
  Caller caller(asked.common);
  nas::PrepareForCalls();
  const SearchOptions options = WithFleet(asked, &caller);
  const Json::Value params = PrepareSearch(options.query, &caller);
  if (options.sort_by.empty()) caller.LeaveUnsorted();
  // From here on the program follows what the user's own processes write.
  caller.module();
  caller.BecomeUser();
  caller.LeaseSearches();
  return Search(&caller, options).Run(params);
}

}  // namespace arbory
