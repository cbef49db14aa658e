// The walker that a search worker runs: opens the locations, makes the result database, runs the
// job and tells the task how it goes.

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <system_error>

#include "nas/base/error.h"
#include "nas/base/file_io.h"
#include "nas/base/unique_fd.h"
#include "nas/results/foreign_accounts.h"
#include "nas/results/result_file.h"
#include "nas/results/result_reader.h"
#include "nas/results/result_writer.h"
#include "nas/search/content_reading.h"
#include "nas/search/fleet_search.h"
#include "nas/search/indexed_walk.h"
#include "nas/search/location.h"
#include "nas/search/search_job.h"
#include "nas/system/child.h"
#include "nas/system/volumes.h"
#include "platform/filesearch.h"
#include "platform/task_record.h"

namespace FileSearch {
namespace {

using Clock = std::chrono::steady_clock;

// The task record is written at most this often for the sake of progress.
constexpr std::chrono::milliseconds kReportInterval(200);
// Rows name their location in 16 bits.
constexpr size_t kMostLocations = 65'535;

// A task's record holds 4 MiB, of which JSON can make six of one byte. An entry of the folders that
// could not be read counts as its path and a little.
constexpr size_t kMostUnreadBytes = size_t{256} << 10;
constexpr size_t kUnreadEntryBytes = 32;

// Descriptors that there is room for before any thread is there: as many as a thousand boxes take.
constexpr int kDescriptorsAtFirst = 2048;

// Each location and each level of a tree that is being read holds a descriptor, and so does each
// connection to a box, so the usual soft bound of 1,024 would end at some hundred folders. The
// kernel's table of them grows at once for a process of one thread; where there are more, each
// doubling waits until all processors have passed through the scheduler, which takes a first page's
// time.
void MakeRoomForDescriptors() {
  rlimit limit;
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
  const nas::UniqueFd any(open("/", O_PATH | O_CLOEXEC));
  const auto room = static_cast<int>(std::min<rlim_t>(limit.rlim_cur, kDescriptorsAtFirst));
  const nas::UniqueFd last(fcntl(any.get(), F_DUPFD_CLOEXEC, room - 1));
}

// Turns what a job threw into the last error. To be called in a catch block.
void SetErrorFromException() {
  try {
    throw;
  } catch (const nas::SqliteError& error) {
    syslog(LOG_ERR, "search: %s", error.what());
    nas::SetLastError(error.error().kind);
  } catch (const std::system_error& error) {
    syslog(LOG_ERR, "search: %s", error.what());
    nas::SetLastError(nas::ErrorFromErrno(error.code().value()));
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "search: %s", error.what());
    nas::SetLastError(nas::kErrorOther);
  }
}

// Results from this many on take noticeably long to sort for the first time.
constexpr std::uint64_t kWorthSorting = 100'000;
// A million rows take three quarters of it. Sorting goes on after that, but the search has
// finished.
constexpr std::chrono::milliseconds kSortingPatience(1000);
constexpr std::chrono::milliseconds kStopTick(25);
constexpr int kSortingNiceness = 10;

// Sorts a search's results by every column, so that no listing of a finished search has to wait for
// it. Done in a process of its own, because it takes some 100 bytes of memory a row, more than a
// worker shall have, and because the worker may go before it. It has none of the worker's
// descriptors, one of which says that the worker is alive. No SQLite handle may be open in this
// process.
pid_t StartSorting(const std::string& path) {
  // Where no process can be had, listings sort for themselves.
  return nas::StartChild([&](int /*pipe*/) {
           if (nice(kSortingNiceness) == -1) errno = 0;
           nas::ResultReader(path).KeepAllOrderings();
         })
      .pid;
}

// What is on this machine and what is on others, at the same time.
class AllNames : public nas::NameSource {
 public:
  // Either may be null.
  AllNames(nas::IndexedWalk* here, nas::FleetSearch* fleet) : here_(here), fleet_(fleet) {}

  void Feed(size_t thread, nas::Judge& judge) override {
    // One thread is enough for all boxes, as it only waits for them.
    if (fleet_ != nullptr && !asking_.exchange(true)) fleet_->Run();
    if (here_ != nullptr) here_->Feed(thread, judge);
  }
  void Abort() override {
    if (here_ != nullptr) here_->Abort();
  }

 private:
  nas::IndexedWalk* const here_;
  nas::FleetSearch* const fleet_;
  std::atomic<bool> asking_ = false;
};

}  // namespace

class WfmSearchWalker::Impl {
 public:
  Impl(const char* user, OKT::Task* task, const int* stop_flag)
      : user_(user), task_(task), stop_flag_(*stop_flag) {}
  ~Impl();
  Impl(const Impl&) = delete;
  Impl& operator=(const Impl&) = delete;

  bool Init(const std::vector<std::string>& texts, const std::vector<FindComp*>& comps);
  bool Walk(const Json::Value& options);
  void set_current_only(bool current_only) { current_only_ = current_only; }
  const char* id() const { return id_.c_str(); }
  const char* volume() const { return volume_.c_str(); }

 private:
  nas::Status OpenLocations(const std::vector<std::string>& texts);
  void Report(const nas::WalkProgress& progress, bool last);
  void CollectReport(const nas::WalkProgress& progress);
  void AddLocations();
  void AskFleet(const Json::Value& options, nas::SharedSearch& search);
  nas::IndexedWalk::Settings NameSettings(const Json::Value& options) const;
  bool RunJob(const Json::Value& options, nas::SharedSearch& search);
  void TellUnread(Json::Value* walk) const;
  bool IsNamedInTask();
  bool stopped() const { return __atomic_load_n(&stop_flag_, __ATOMIC_RELAXED) != 0; }
  void WaitForSorting(pid_t child) const;
  [[noreturn]] void EndWorker();
  bool IsForsaken();
  void Vanish();

  const std::string user_;
  OKT::Task* const task_;
  const int& stop_flag_;
  std::vector<FindComp*> comps_;
  std::vector<nas::Location> locations_;             // on this machine
  std::vector<nas::FleetLocation> fleet_locations_;  // on others
  std::vector<nas::Error> unopened_;  // of each of the others, with the location's text
  std::string volume_;
  std::string folder_;
  std::string id_;
  std::optional<nas::ResultClaim> claim_;  // before the writer, which it has to outlive
  std::unique_ptr<nas::ResultWriter> writer_;
  nas::IndexedWalk* names_ = nullptr;  // of Walk
  nas::UnreadFolders unread_;
  std::optional<nas::FleetSearch> fleet_;
  bool walked_ = false;
  bool current_only_ = false;
  bool told_ready_ = false;
  bool forsaken_ = false;
  Clock::time_point reported_;
};

// What was never walked and stands in no task, nobody can ask for or clean.
WfmSearchWalker::Impl::~Impl() {
  writer_.reset();
  if (id_.empty() || walked_ || IsNamedInTask()) return;
  nas::RemoveResultFile(nas::ResultPath(folder_, id_));
}

bool WfmSearchWalker::Impl::IsNamedInTask() try {
  if (!task_->reload()) return false;
  const Json::Value data = task_->getProperty(task_record::kData);
  return data.isObject() && data[task_record::kDatabaseId] == id_;
} catch (const std::exception&) {
  return true;  // for want of memory; what is kept can be cleaned
}

// Fails, with what is wrong with the first, where none can be opened. A search that is stopped
// meanwhile opens no further one, as each may wait for a disk, but goes on with what it has:
// whoever stops a search may still ask for its results.
nas::Status WfmSearchWalker::Impl::OpenLocations(const std::vector<std::string>& texts) {
  std::optional<nas::Error> first;
  const auto any = [this] { return !locations_.empty() || !fleet_locations_.empty(); };
  for (const std::string& text : texts) {
    if (stopped() && (first || any())) break;
    nas::Result<nas::Location> location = nas::Error{nas::kErrorOther, E2BIG, text};
    if (locations_.size() + fleet_locations_.size() < kMostLocations) {
      auto elsewhere = nas::FindFleetLocation(text);
      if (elsewhere && *elsewhere) {
        fleet_locations_.push_back(std::move(**elsewhere));
        continue;
      }
      location = elsewhere ? elsewhere->error() : nas::OpenLocation(text);
    }
    if (location) {
      locations_.push_back(std::move(*location));
      continue;
    }
    unopened_.push_back(location.error());
    if (!first) first = location.error();
  }
  if (any()) return {};
  return first ? *first : nas::Error{nas::kErrorNoSuchFolder, ENOENT};
}

bool WfmSearchWalker::Impl::Init(const std::vector<std::string>& texts,
                                 const std::vector<FindComp*>& comps) try {
  comps_ = comps;
  MakeRoomForDescriptors();
  if (const nas::Status opened = OpenLocations(texts); !opened) {
    nas::Report(opened.error());
    return false;
  }
  const std::string preferred = locations_.empty() ? "" : locations_.front().share.volume;
  const auto volume = nas::ResultVolume(preferred, user_);
  if (!volume) {
    nas::Report(volume.error());
    return false;
  }
  volume_ = *volume;
  folder_ = nas::ResultFolderPath(volume_, user_);
  nas::SweepResultFolder(folder_);
  id_ = nas::NewResultId();
  const std::string path = nas::ResultPath(folder_, id_);
  claim_.emplace(path);
  writer_ = std::make_unique<nas::ResultWriter>(path);
  AddLocations();
  return true;
} catch (...) {
  SetErrorFromException();
  return false;
}

void WfmSearchWalker::Impl::AddLocations() {
  std::uint16_t number = 0;
  for (const nas::Location& location : locations_) {
    writer_->AddLocation(number++, location.share.name, location.share.root);
  }
}

void WfmSearchWalker::Impl::AskFleet(const Json::Value& options, nas::SharedSearch& search) {
  if (fleet_locations_.empty()) return;
  nas::FleetSearch::Settings settings;
  settings.recursive = !current_only_;
  settings.contents = options.get("search_content", false).asBool();
  settings.add_account = [this](std::uint32_t id, const std::string& name) {
    writer_->AddAccount(id, name);
  };
  settings.add_share = [this](std::uint16_t number, const std::string& name) {
    writer_->AddLocation(number, name, nas::kFleetRoot + name);
  };
  settings.first_number = static_cast<std::uint16_t>(locations_.size());
  fleet_.emplace(fleet_locations_, std::move(settings), search);
}

bool WfmSearchWalker::Impl::Walk(const Json::Value& options) {
  walked_ = true;
  nas::SharedSearch search(comps_, *writer_, stop_flag_);
  search.names_alone = !nas::CurrentConfig().keep_attributes;
  std::unique_ptr<nas::IndexedWalk> names;
  try {
    names = std::make_unique<nas::IndexedWalk>(locations_, NameSettings(options), search);
    names_ = names.get();
    AskFleet(options, search);
    return RunJob(options, search);
  } catch (...) {
    SetErrorFromException();
  }
  // How far it came, on a full disk too: a task keeps space for that.
  Report(search.progress, true);
  return false;
}

nas::IndexedWalk::Settings WfmSearchWalker::Impl::NameSettings(const Json::Value& options) const {
  return {.recursive = !current_only_,
          .texts_too = options.get("search_content", false).asBool(),
          .use = nas::CurrentConfig().index_use,
          .temporary_folder = folder_};
}

bool WfmSearchWalker::Impl::RunJob(const Json::Value& options, nas::SharedSearch& search) {
  for (const nas::Error& error : unopened_) search.progress.AddSkipped(error.error_number);
  if (nas::CurrentConfig().list_unread) search.unread = &unread_;
  search.SearchContents(folder_, options.get("search_content", false).asBool());
  nas::ContentReading contents(locations_, search);
  nas::SearchJob job(search, {.report = [this](const auto& progress) { Report(progress, false); },
                              .stuck = [this] { EndWorker(); },
                              .threads = nas::CurrentConfig().search_threads});
  AllNames all(locations_.empty() ? nullptr : names_, fleet_ ? &*fleet_ : nullptr);
  bool completed = job.Run(all, contents);
  if (IsForsaken()) {
    Vanish();
    return false;
  }
  writer_->Complete();
  const bool nobody = completed && fleet_ && locations_.empty() && fleet_->failed();
  // Who is told that everything was found does not wait for how it ends: as a failure, here.
  if (completed && !nobody) search.progress.SetPhase(nas::WalkProgress::Phase::kDone);
  const bool sorts = writer_->rows() >= kWorthSorting && nas::CurrentConfig().keep_orderings;
  // Where the end follows at once, one write of the record tells both.
  if (sorts) {
    Report(search.progress, true);
  } else {
    CollectReport(search.progress);
  }
  writer_->EmptyLog();
  if (nobody) {
    nas::SetLastError(nas::kErrorOther);
    completed = false;
  }
  if (sorts) {
    writer_.reset();
    WaitForSorting(StartSorting(nas::ResultPath(folder_, id_)));
  }
  return completed;
}

void WfmSearchWalker::Impl::WaitForSorting(pid_t child) const {
  // What a stopped search has found is sorted without anybody waiting for it.
  if (child < 0 || stopped()) return;
  const Clock::time_point end = Clock::now() + kSortingPatience;
  const nas::UniqueFd sorting(static_cast<int>(syscall(SYS_pidfd_open, child, 0)));
  pollfd ended{sorting.get(), POLLIN, 0};
  while (sorting && !stopped() && Clock::now() < end) {
    if (poll(&ended, 1, static_cast<int>(kStopTick.count())) > 0) break;
  }
  // Who stops a search that has found everything has no more use for it.
  if (stopped()) kill(child, SIGKILL);
  waitpid(child, nullptr, WNOHANG);
}

// A thread cannot be ended, but a process can: this is how a stopped search's worker ends, only
// without waiting for the walk to return.
void WfmSearchWalker::Impl::EndWorker() {
  if (IsForsaken()) Vanish();
  task_->finish(false);
  _exit(0);
}

void WfmSearchWalker::Impl::TellUnread(Json::Value* walk) const {
  Json::Value& all = (*walk)[task_record::kUnread] = Json::arrayValue;
  size_t bytes = 0;
  const auto tell = [&](const std::string& path, int error_number) {
    bytes += path.size() + kUnreadEntryBytes;
    if (bytes > kMostUnreadBytes) return;
    Json::Value& one = all.append(Json::objectValue);
    one[task_record::kPath] = path;
    one[task_record::kUnreadErrno] = error_number;
  };
  for (const nas::Error& error : unopened_) tell(error.path, error.error_number);
  for (const nas::UnreadFolders::Folder& folder : unread_.folders()) {
    tell(locations_[folder.location].share.root + "/" + folder.path, folder.error_number);
  }
}

// For the next write of the task's record.
void WfmSearchWalker::Impl::CollectReport(const nas::WalkProgress& progress) {
  task_->beginUpdate();
  Json::Value walk = progress.ToJson();
  if (names_ != nullptr) names_->Tell(&walk);
  if (nas::CurrentConfig().list_unread) TellUnread(&walk);
  if (fleet_) fleet_->Tell(&walk);
  task_->setProperty(task_record::kWalk, walk);
  if (!told_ready_) task_->setProperty(task_record::kResultReady, true);
}

void WfmSearchWalker::Impl::Report(const nas::WalkProgress& progress, bool last) {
  const Clock::time_point now = Clock::now();
  if (!last && told_ready_ && now - reported_ < kReportInterval) return;
  reported_ = now;
  CollectReport(progress);
  // A task that was removed meanwhile has nobody left to tell.
  task_->endUpdate();
  told_ready_ = true;
  if (last || stopped()) return;
  // Ends the way a search does that is told to stop. It was, where somebody has marked it as
  // finished, even if their signal was never sent.
  forsaken_ = task_->isForsaken();
  if (forsaken_ || task_->isFinished()) raise(SIGTERM);
}

// A clean tells the worker to stop before it removes what the task names, and may fail between:
// then nobody but the worker knows what it has found.
bool WfmSearchWalker::Impl::IsForsaken() { return forsaken_ || (stopped() && task_->isForsaken()); }

// What nobody asks after leaves nothing. The database goes first, as when it is cleaned.
void WfmSearchWalker::Impl::Vanish() {
  writer_.reset();
  nas::RemoveResultFile(nas::ResultPath(folder_, id_));
  task_->remove();
}

WfmSearchWalker::WfmSearchWalker(const char* user, const char* /*session*/, OKT::Task* task,
                                 int* stop_flag)
    : impl_(std::make_unique<Impl>(user, task, stop_flag)) {}

WfmSearchWalker::~WfmSearchWalker() = default;

bool WfmSearchWalker::init(const std::vector<std::string>& locations,
                           const std::vector<FindComp*>& comps) {
  return impl_->Init(locations, comps);
}

void WfmSearchWalker::setSearchCurrentDir(bool current_only) {
  impl_->set_current_only(current_only);
}

const char* WfmSearchWalker::getDBTaskId() { return impl_->id(); }

const char* WfmSearchWalker::getDBVol() { return impl_->volume(); }

// Access times are among the criteria given to init, and those are judged before any file is read,
// so the separate list has nothing to add.
bool WfmSearchWalker::Walk(const std::vector<FindATimeComp*>& /*atime_comps*/,
                           const Json::Value& options) {
  return impl_->Walk(options);
}

}  // namespace FileSearch
