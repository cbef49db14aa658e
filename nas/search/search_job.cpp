#include "nas/search/search_job.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <exception>

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// How often the job looks at the stop flag while its threads work; bounds the time to stop. The
// first time comes sooner, so that a first page can be asked for at once.
constexpr milliseconds kTick(25);
constexpr milliseconds kFirstTick(5);
// What threads get to notice the stop flag; with a tick before it, a tenth of a second in all.
constexpr milliseconds kStopPatience(75);
// Rows wait at most this long before listings can see them, the first ones the first tick. A long
// search writes ever less often, so that its rows do not end up in very many small blocks.
constexpr milliseconds kFlushInterval(25);
constexpr milliseconds kSlowestFlush(1000);
constexpr int kFlushShare = 200;  // one part of the elapsed time

// A search begins with a thread for each core, which is all that cached folders can use; more than
// eight only wait for locks inside the kernel. While it waits for a disk it is given more: a drive
// orders what it is asked for at once, and solid ones work on many requests at a time. Each costs
// half a megabyte.
constexpr unsigned kFewestThreads = 2;
constexpr unsigned kMostAtFirst = 8;
constexpr size_t kMostThreads = FolderStack::kMostThreads;
// A search that got less than this part of its cores, and read from a disk, waits for the disk.
constexpr double kBusyShare = 0.7;

// Tells from tick to tick whether the process waits for disks.
class DiskWatch {
 public:
  explicit DiskWatch(unsigned cores) : cores_(cores) { Waiting(); }

  bool Waiting() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    const auto seconds = [](const timeval& t) {
      return static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_usec) * 1e-6;
    };
    const double used = seconds(usage.ru_utime) + seconds(usage.ru_stime);
    const Clock::time_point now = Clock::now();
    const double possible = std::chrono::duration<double>(now - looked_).count() * cores_;
    const bool waiting = usage.ru_inblock > blocks_ && used - used_ < kBusyShare * possible;
    looked_ = now;
    used_ = used;
    blocks_ = usage.ru_inblock;
    return waiting;
  }

 private:
  const unsigned cores_;
  Clock::time_point looked_;
  double used_ = 0;  // seconds of processor time
  long blocks_ = 0;  // read from disks
};

unsigned ThreadsAtFirst() {
  return std::clamp(std::thread::hardware_concurrency(), kFewestThreads, kMostAtFirst);
}

}  // namespace

SearchJob::SearchJob(const std::vector<Location>& locations,
                     const std::vector<FileSearch::FindComp*>& comps, ResultWriter& writer,
                     const int& stop_flag, Settings settings)
    : settings_(std::move(settings)), shared_(locations, comps, writer, stop_flag) {
  shared_.recursive = settings_.recursive;
  for (const int error_number : settings_.unopened) shared_.progress.AddSkipped(error_number);
  if (settings_.search_content && shared_.criteria.pattern != nullptr) {
    shared_.content = ContentQuery::From(shared_.criteria.pattern->pattern());
  }
  if (shared_.content) {
    shared_.candidates = std::make_unique<CandidateList>(settings_.temporary_folder);
  }
  std::vector<std::string> volumes = ListVolumes();
  volumes.push_back(ScratchVolume());
  for (const std::string& volume : volumes) {
    struct stat status;
    if (stat((volume + "/@tmp").c_str(), &status) == 0) {
      shared_.never_entered.emplace(status.st_dev, status.st_ino);
    }
  }
}

void SearchJob::Fail(std::exception_ptr failure) {
  const std::lock_guard lock(mutex_);
  if (!failure_) failure_ = std::move(failure);
  shared_.failed = true;
  shared_.stack.Abort();
}

bool SearchJob::Run() {
  PushLocations();
  RunPhase(&WalkThread::WalkNames);
  if (shared_.content && !shared_.stopping()) {
    shared_.progress.SetPhase(WalkProgress::Phase::kContents);
    RunPhase(&WalkThread::WalkContents);
  }
  if (failure_) std::rethrow_exception(failure_);
  Flush();
  const bool completed = !shared_.stopping();
  if (completed) shared_.progress.SetPhase(WalkProgress::Phase::kDone);
  return completed;
}

void SearchJob::PushLocations() {
  const std::vector<Location>& locations = shared_.locations;
  for (size_t i = 0; i < locations.size(); ++i) {
    const Location& location = locations[i];
    if (locations.size() > 1 &&
        !shared_.location_ids.emplace(location.device, location.inode).second) {
      continue;  // the same folder once more
    }
    auto batch = std::make_shared<FolderBatch>();
    batch->parent = UniqueFd(fcntl(location.fd.get(), F_DUPFD_CLOEXEC, 0));
    batch->location = static_cast<std::uint16_t>(i);
    batch->parent_path = location.path;
    batch->names.assign(".\0", 2);
    shared_.stack.Push(0, std::move(batch));
  }
}

void SearchJob::RunPhase(Work work) {
  const unsigned count = ThreadsAtFirst();
  for (unsigned i = 0; i < count; ++i) StartThread(work);
  Tend(work);
  handles_.clear();
}

// Starts one more thread. Where the machine gives none, the search goes on with those it has.
void SearchJob::StartThread(Work work) {
  const size_t number = handles_.size();
  if (number == threads_.size()) threads_.push_back(std::make_unique<WalkThread>(shared_, number));
  WalkThread* thread = threads_[number].get();
  {
    const std::lock_guard lock(mutex_);
    ++running_;
  }
  const auto ended = [this] {
    const std::lock_guard lock(mutex_);
    if (--running_ == 0) ended_.notify_all();
  };
  try {
    handles_.emplace_back([this, thread, work, ended] {
      try {
        (thread->*work)();
      } catch (...) {
        Fail(std::current_exception());
      }
      ended();
    });
  } catch (const std::exception&) {  // no thread, or no memory for one
    ended();
    if (handles_.empty()) throw;
  }
}

// Waits for the threads; meanwhile looks after the stop flag, the rows, the report and the disk.
void SearchJob::Tend(Work work) {
  const Clock::time_point begun = Clock::now();
  Clock::time_point flushed;
  DiskWatch disk(ThreadsAtFirst());
  milliseconds tick = kFirstTick;
  std::unique_lock lock(mutex_);
  while (!ended_.wait_for(lock, tick, [this] { return running_ == 0; })) {
    lock.unlock();
    tick = kTick;
    if (shared_.stopping()) shared_.stack.Abort();
    const Clock::time_point now = Clock::now();
    const auto interval =
        std::clamp(std::chrono::duration_cast<milliseconds>((now - begun) / kFlushShare),
                   kFlushInterval, kSlowestFlush);
    try {
      if (now - flushed >= interval) {
        Flush();
        flushed = now;
      }
      settings_.report(shared_.progress);
      LookForStuckThreads(now);
      if (disk.Waiting() && handles_.size() < kMostThreads) StartThread(work);
    } catch (...) {
      Fail(std::current_exception());
    }
    lock.lock();
  }
}

void SearchJob::LookForStuckThreads(Clock::time_point now) {
  if (__atomic_load_n(&shared_.stop_flag, __ATOMIC_RELAXED) == 0 || told_stuck_) return;
  if (!stop_seen_) stop_seen_ = now;
  if (now - *stop_seen_ < kStopPatience) return;
  told_stuck_ = true;
  Flush();
  if (settings_.stuck) settings_.stuck();
}

void SearchJob::Flush() {
  for (const auto& thread : threads_) thread->Flush();
}

}  // namespace nas
