#include "nas/search/search_job.h"

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <exception>

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// How often the job looks at the stop flag while its threads work; bounds the time to stop.
constexpr milliseconds kTick(25);
// The same until there is a first row, so that a first page can be asked for at once. Whoever waits
// for it is told nothing before: an index has said all that it knows in less than a tick, and who
// wakes meanwhile to look at nothing takes the processor from it.
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
constexpr size_t kMostThreads = NameSource::kMostThreads;
// A search that got less than this part of its cores, and read from a disk, waits for the disk.
constexpr double kBusyShare = 0.7;

// Somebody waits for a search's first rows, and nobody looks at all the others as they come: from
// there on, or after so long without one, its threads leave three quarters of a busy processor to
// searches that begin and to pages. Alone on the machine they lose nothing.
constexpr milliseconds kLongestFirst(100);
constexpr int kBehind = 5;  // nicer than before

void LetOthersGoFirst(pid_t thread) {
  const auto id = static_cast<id_t>(thread);
  setpriority(PRIO_PROCESS, id, getpriority(PRIO_PROCESS, id) + kBehind);
}

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

void SearchJob::Fail(std::exception_ptr failure) {
  const std::lock_guard lock(mutex_);
  if (!failure_) failure_ = std::move(failure);
  search_.failed = true;
  source_->Abort();
}

bool SearchJob::Run(NameSource& names, NameSource& contents) {
  RunPhase(names);
  if (search_.content && !search_.stopping()) {
    search_.progress.SetPhase(WalkProgress::Phase::kContents);
    RunPhase(contents);
  }
  if (failure_) std::rethrow_exception(failure_);
  Flush();
  return !search_.stopping();
}

void SearchJob::RunPhase(NameSource& source) {
  source_ = &source;
  const unsigned count =
      settings_.threads > 0 ? static_cast<unsigned>(settings_.threads) : ThreadsAtFirst();
  for (unsigned i = 0; i < count; ++i) StartThread(source);
  Tend(source);
  handles_.clear();
}

// Starts one more thread. Where the machine gives none, the search goes on with those it has.
void SearchJob::StartThread(NameSource& source) {
  const size_t number = handles_.size();
  if (number == judges_.size()) judges_.push_back(std::make_unique<Judge>(search_));
  {
    const std::lock_guard lock(mutex_);
    ++running_;
  }
  const auto ended = [this] {
    const std::lock_guard lock(mutex_);
    std::erase(threads_, gettid());
    if (--running_ == 0) ended_.notify_all();
  };
  try {
    handles_.emplace_back([this, number, &source, judge = judges_[number].get(), ended] {
      try {
        TakePlace();
        source.Feed(number, *judge);
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
void SearchJob::Tend(NameSource& source) {
  const Clock::time_point begun = Clock::now();
  Clock::time_point flushed;
  DiskWatch disk(ThreadsAtFirst());
  milliseconds tick = kFirstTick;
  std::unique_lock lock(mutex_);
  while (!ended_.wait_for(lock, tick, [this] { return running_ == 0; })) {
    const Clock::time_point now = Clock::now();
    const bool nothing_yet = search_.progress.matches() == 0 && now - begun < kTick;
    if (nothing_yet && !search_.stopping()) continue;
    lock.unlock();
    tick = kTick;
    if (search_.stopping()) source_->Abort();
    const auto interval =
        std::clamp(std::chrono::duration_cast<milliseconds>((now - begun) / kFlushShare),
                   kFlushInterval, kSlowestFlush);
    try {
      if (now - flushed >= interval) {
        Flush();
        flushed = now;
      }
      settings_.report(search_.progress);
      if (search_.progress.matches() > 0 || now - begun >= kLongestFirst) StepBehind();
      LookForStuckThreads(now);
      const bool more = settings_.threads == 0 && handles_.size() < kMostThreads;
      if (disk.Waiting() && more) StartThread(source);
    } catch (...) {
      Fail(std::current_exception());
    }
    lock.lock();
  }
}

void SearchJob::TakePlace() {
  const std::lock_guard lock(mutex_);
  threads_.push_back(gettid());
  if (behind_) LetOthersGoFirst(gettid());
}

void SearchJob::StepBehind() {
  const std::lock_guard lock(mutex_);
  if (behind_) return;
  behind_ = true;
  for (const pid_t thread : threads_) LetOthersGoFirst(thread);
}

void SearchJob::LookForStuckThreads(Clock::time_point now) {
  if (!search_.stopped() || told_stuck_) return;
  if (!stop_seen_) stop_seen_ = now;
  if (now - *stop_seen_ < kStopPatience) return;
  told_stuck_ = true;
  Flush();
  if (settings_.stuck) settings_.stuck();
}

void SearchJob::Flush() {
  for (const auto& judge : judges_) judge->Flush();
}

}  // namespace nas
