#include "nas/engine/search_job.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/statfs.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <thread>

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// How often the job looks at the stop flag while its threads work; bounds the time to stop. The
// first time comes sooner, so that a first page can be asked for at once.
constexpr milliseconds kTick(25);
constexpr milliseconds kFirstTick(5);
// Rows wait at most this long before listings can see them, the first ones the first tick. A long
// search writes ever less often, so that its rows do not end up in very many small blocks.
constexpr milliseconds kFlushInterval(50);
constexpr milliseconds kSlowestFlush(1000);
constexpr int kFlushShare = 200;  // one part of the elapsed time

// Reading folders is bound by the processor when they are cached, and by waiting when they are
// not: two threads keep both busy on the smallest machine, and more than eight only wait for locks
// inside the kernel.
constexpr unsigned kFewestThreads = 2;
constexpr unsigned kMostThreads = 8;

// Files handed out at a time for reading their contents: few enough to spread over the threads.
constexpr size_t kCandidatesInRecord = 64;

constexpr unsigned kAttributeMask = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | STATX_ATIME |
                                    STATX_MTIME | STATX_CTIME | STATX_SIZE | STATX_BTIME;

// File systems without files of anybody's own.
bool IsPseudoFileSystem(int folder) {
  struct statfs status;
  if (fstatfs(folder, &status) != 0) return false;
  switch (static_cast<std::uint32_t>(status.f_type)) {
    case PROC_SUPER_MAGIC:
    case SYSFS_MAGIC:
    case DEBUGFS_MAGIC:
    case TRACEFS_MAGIC:
    case SECURITYFS_MAGIC:
    case SELINUX_MAGIC:
    case CGROUP_SUPER_MAGIC:
    case CGROUP2_SUPER_MAGIC:
    case PSTOREFS_MAGIC:
    case EFIVARFS_MAGIC:
    case BPF_FS_MAGIC:
    case DEVPTS_SUPER_MAGIC:
    case BINFMTFS_MAGIC:
    case BINDERFS_SUPER_MAGIC:
    case NSFS_MAGIC:
    case 0x19800202:  // POSIX message queues
    case 0x62656570:  // configfs
    case 0x65735543:  // FUSE control
    case 0x67596969:  // RPC pipes
      return true;
    default:
      return false;
  }
}

}  // namespace

Criteria::Criteria(const std::vector<FileSearch::FindComp*>& comps) {
  for (const FileSearch::FindComp* comp : comps) {
    if (const auto* named = dynamic_cast<const PatternComp*>(comp);
        named != nullptr && pattern == nullptr) {
      pattern = named;
    } else if (comp->needs() == FileSearch::FindComp::Needs::kAttributes) {
      attribute.push_back(comp);
    } else {
      cheap.push_back(comp);
    }
  }
}

class SearchJob::Thread {
 public:
  explicit Thread(SearchJob& job) : job_(job) {
    if (job.content_) scanner_.emplace(*job.content_, job.stop_flag_);
  }

  // Reads folders until none is left.
  void WalkNames();
  // Reads candidates until none is left.
  void WalkContents();
  // Makes the rows found so far visible. Callable from any thread.
  void Flush() {
    const std::lock_guard lock(rows_mutex_);
    job_.writer_.Append(rows_);
  }

 private:
  struct Folder {
    int fd = -1;
    std::uint16_t location = 0;
    std::string path;
    bool named_in_rows = false;  // whether rows_ was told of this folder
  };

  UniqueFd OpenFolder(const FolderStack::Item& item);
  bool MayEnter(int fd, std::string_view name, bool crossed) const;
  void ReadFolder(const FolderStack::Item& item, UniqueFd fd);
  void Judge(const DirectoryReader::Entry& entry);
  bool FetchAttributes(const char* name, FileAttributes& attributes);
  unsigned char TypeOf(const char* name) const;
  bool AttributesMatch() const;
  void AddRow(std::string_view name, const FileAttributes& attributes);
  void AddCandidate(const DirectoryReader::Entry& entry);
  void HandOverCandidates();
  void ScanRecord(const CandidateList::Record& record);
  void ScanFile(const char* name);

  SearchJob& job_;
  DirectoryReader reader_;
  FoldedName folded_;
  FileSearch::WalkEntry entry_;
  Folder folder_;  // being read
  std::vector<std::pair<ino_t, std::string>> candidates_;
  std::optional<ContentScanner> scanner_;

  std::mutex rows_mutex_;  // guards rows_
  RowBlock rows_;
};

void SearchJob::Thread::WalkNames() {
  FolderStack::Item item;
  while (job_.stack_.Take(item)) {
    UniqueFd fd = OpenFolder(item);
    if (fd) ReadFolder(item, std::move(fd));
    if (job_.stopping()) job_.stack_.Abort();
  }
}

// The folder, or an invalid descriptor where it cannot or shall not be read.
UniqueFd SearchJob::Thread::OpenFolder(const FolderStack::Item& item) {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK;
  const bool is_location = item.name == ".";
  // Mount points answer EXDEV, so that every other folder is spared the question what it is on.
  bool crossed = false;
  UniqueFd fd = OpenOnSameMount(item.batch->parent.get(), item.name.data(), kFlags);
  if (!fd && errno == EXDEV) {
    crossed = true;
    fd.Reset(openat(item.batch->parent.get(), item.name.data(), kFlags));
  }
  if (!fd) {
    job_.progress_.AddSkipped(errno);
    return fd;
  }
  if (!is_location && !MayEnter(fd.get(), item.name, crossed)) fd.Reset();
  return fd;
}

bool SearchJob::Thread::MayEnter(int fd, std::string_view name, bool crossed) const {
  if (crossed && IsPseudoFileSystem(fd)) return false;
  const bool may_be_temporary = name == "@tmp" && !job_.never_entered_.empty();
  if (!may_be_temporary && job_.location_ids_.empty()) return true;
  struct stat status;
  if (fstat(fd, &status) != 0) return true;
  const std::pair id(status.st_dev, status.st_ino);
  // A location inside another is walked once, as a location.
  return !job_.never_entered_.contains(id) && !job_.location_ids_.contains(id);
}

void SearchJob::Thread::ReadFolder(const FolderStack::Item& item, UniqueFd fd) {
  folder_.fd = fd.get();
  folder_.location = item.batch->location;
  folder_.path = item.batch->parent_path;
  folder_.named_in_rows = false;
  if (item.name != ".") {
    if (!folder_.path.empty()) folder_.path.push_back('/');
    folder_.path.append(item.name);
  }
  auto below = std::make_shared<FolderBatch>();
  std::uint64_t entries = 0;
  DirectoryReader::Entry entry;
  reader_.Start(fd.get());
  while (reader_.Next(entry) && !job_.stopping()) {
    ++entries;
    if (entry.type == DT_UNKNOWN) entry.type = TypeOf(entry.name.data());
    if (entry.type == DT_DIR && job_.settings_.recursive) {
      below->names.append(entry.name).push_back('\0');
    }
    Judge(entry);
  }
  if (reader_.failed() != 0) job_.progress_.AddSkipped(reader_.failed());
  job_.progress_.AddFolder(entries);
  HandOverCandidates();
  if (below->names.empty()) return;
  below->location = folder_.location;
  below->parent_path = folder_.path;
  below->parent = std::move(fd);
  job_.stack_.Push(std::move(below));
}

// Asks for the type that the directory did not tell.
unsigned char SearchJob::Thread::TypeOf(const char* name) const {
  struct statx status;
  if (statx(folder_.fd, name, AT_SYMLINK_NOFOLLOW | AT_STATX_DONT_SYNC, STATX_TYPE, &status) != 0) {
    return DT_UNKNOWN;
  }
  return IFTODT(status.stx_mode);
}

void SearchJob::Thread::Judge(const DirectoryReader::Entry& entry) {
  folded_.Set(entry.name);
  entry_.name = &folded_;
  entry_.is_dir = entry.type == DT_DIR;
  const Criteria& criteria = job_.criteria_;
  const bool named = criteria.pattern == nullptr || criteria.pattern->match(entry_);
  const bool candidate = !named && job_.content_ && entry.type == DT_REG;
  if (!named && !candidate) return;
  for (const FileSearch::FindComp* comp : criteria.cheap) {
    if (!comp->match(entry_)) return;
  }
  FileAttributes attributes;
  if (named || !criteria.attribute.empty()) {
    if (!FetchAttributes(entry.name.data(), attributes)) return;
    entry_.attributes = &attributes;
    if (!AttributesMatch()) return;
  }
  if (named) {
    AddRow(entry.name, attributes);
  } else {
    AddCandidate(entry);
  }
}

bool SearchJob::Thread::AttributesMatch() const {
  return std::ranges::all_of(job_.criteria_.attribute, [this](const FileSearch::FindComp* comp) {
    return comp->match(entry_);
  });
}

bool SearchJob::Thread::FetchAttributes(const char* name, FileAttributes& attributes) {
  struct statx status;
  if (statx(folder_.fd, name, AT_SYMLINK_NOFOLLOW | AT_STATX_DONT_SYNC, kAttributeMask, &status) !=
      0) {
    job_.progress_.AddSkipped(errno);
    return false;
  }
  attributes.size = status.stx_size;
  attributes.atime = status.stx_atime.tv_sec;
  attributes.mtime = status.stx_mtime.tv_sec;
  attributes.ctime = status.stx_ctime.tv_sec;
  attributes.crtime =
      (status.stx_mask & STATX_BTIME) != 0 ? status.stx_btime.tv_sec : FileAttributes::kNoTime;
  attributes.mode = status.stx_mode;
  attributes.uid = status.stx_uid;
  attributes.gid = status.stx_gid;
  return true;
}

void SearchJob::Thread::AddRow(std::string_view name, const FileAttributes& attributes) {
  job_.progress_.AddMatch();
  const std::lock_guard lock(rows_mutex_);
  if (!folder_.named_in_rows) {
    rows_.SetFolder(folder_.location, folder_.path);
    folder_.named_in_rows = true;
  }
  rows_.Add(name, attributes);
  if (rows_.full()) job_.writer_.Append(rows_);
}

void SearchJob::Thread::AddCandidate(const DirectoryReader::Entry& entry) {
  candidates_.emplace_back(entry.inode, entry.name);
}

// Files are read in the order of their inodes, which on a rotating disk is nearly that of their
// places.
void SearchJob::Thread::HandOverCandidates() {
  if (candidates_.empty()) return;
  std::ranges::sort(candidates_);
  std::string names;
  size_t count = 0;
  for (const auto& [inode, name] : candidates_) {
    names.append(name).push_back('\0');
    if (++count % kCandidatesInRecord == 0 || count == candidates_.size()) {
      job_.candidates_->Add(folder_.location, folder_.path, names);
      names.clear();
    }
  }
  candidates_.clear();
}

void SearchJob::Thread::WalkContents() {
  CandidateList::Record record;
  while (!job_.stopping() && job_.candidates_->Take(record)) ScanRecord(record);
}

void SearchJob::Thread::ScanRecord(const CandidateList::Record& record) {
  const Location& location = job_.locations_[record.location];
  folder_.location = record.location;
  folder_.path = record.folder_path;
  folder_.named_in_rows = false;
  // Paths begin at the share, folders are opened from the location.
  std::string_view below = record.folder_path;
  below.remove_prefix(std::min(below.size(), location.path.size()));
  if (below.starts_with('/')) below.remove_prefix(1);
  const UniqueFd fd = OpenBelow(location.fd.get(), below, O_PATH | O_DIRECTORY);
  if (!fd) {
    job_.progress_.AddSkipped(errno);
    return;
  }
  folder_.fd = fd.get();
  for (std::string_view names = record.names; !names.empty() && !job_.stopping();) {
    const size_t length = names.find('\0');
    ScanFile(names.data());
    names.remove_prefix(length + 1);
  }
}

void SearchJob::Thread::ScanFile(const char* name) {
  switch (scanner_->Scan(folder_.fd, name)) {
    case ContentScanner::Result::kMatch: {
      FileAttributes attributes;
      if (FetchAttributes(name, attributes)) AddRow(name, attributes);
      break;
    }
    case ContentScanner::Result::kFailed:
      job_.progress_.AddSkipped(errno);
      break;
    case ContentScanner::Result::kNoMatch:
    case ContentScanner::Result::kStopped:
      break;
  }
}

SearchJob::SearchJob(const std::vector<Location>& locations,
                     const std::vector<FileSearch::FindComp*>& comps, ResultWriter& writer,
                     const int& stop_flag, Settings settings)
    : locations_(locations),
      criteria_(comps),
      writer_(writer),
      stop_flag_(stop_flag),
      settings_(std::move(settings)) {
  if (settings_.search_content && criteria_.pattern != nullptr) {
    content_ = ContentQuery::From(criteria_.pattern->pattern());
  }
  if (content_) candidates_ = std::make_unique<CandidateList>(settings_.temporary_folder);
  std::vector<std::string> volumes = ListVolumes();
  volumes.push_back(ScratchVolume());
  for (const std::string& volume : volumes) {
    struct stat status;
    if (stat((volume + "/@tmp").c_str(), &status) == 0) {
      never_entered_.emplace(status.st_dev, status.st_ino);
    }
  }
  const unsigned count =
      std::clamp(std::thread::hardware_concurrency(), kFewestThreads, kMostThreads);
  for (unsigned i = 0; i < count; ++i) threads_.push_back(std::make_unique<Thread>(*this));
}

SearchJob::~SearchJob() = default;

bool SearchJob::stopping() const {
  return __atomic_load_n(&stop_flag_, __ATOMIC_RELAXED) != 0 ||
         failed_.load(std::memory_order_relaxed);
}

void SearchJob::Fail(std::exception_ptr failure) {
  const std::lock_guard lock(mutex_);
  if (!failure_) failure_ = std::move(failure);
  failed_ = true;
  stack_.Abort();
}

bool SearchJob::Run() {
  for (size_t i = 0; i < locations_.size(); ++i) {
    const Location& location = locations_[i];
    if (locations_.size() > 1 && !location_ids_.emplace(location.device, location.inode).second) {
      continue;  // the same folder once more
    }
    auto batch = std::make_shared<FolderBatch>();
    batch->parent = UniqueFd(fcntl(location.fd.get(), F_DUPFD_CLOEXEC, 0));
    batch->location = static_cast<std::uint16_t>(i);
    batch->parent_path = location.path;
    batch->names.assign(".\0", 2);
    stack_.Push(std::move(batch));
  }
  RunPhase(&Thread::WalkNames);
  if (content_ && !stopping()) {
    progress_.SetPhase(WalkProgress::Phase::kContents);
    RunPhase(&Thread::WalkContents);
  }
  if (failure_) std::rethrow_exception(failure_);
  Flush();
  const bool completed = !stopping();
  if (completed) progress_.SetPhase(WalkProgress::Phase::kDone);
  return completed;
}

void SearchJob::RunPhase(void (Thread::*work)()) {
  running_ = static_cast<int>(threads_.size());
  std::vector<std::jthread> running;
  for (const auto& thread : threads_) {
    running.emplace_back([this, work, &thread] {
      try {
        (thread.get()->*work)();
      } catch (...) {
        Fail(std::current_exception());
      }
      const std::lock_guard lock(mutex_);
      if (--running_ == 0) ended_.notify_all();
    });
  }
  Wait();
}

// Waits for the threads; meanwhile looks after the stop flag, the rows and the report.
void SearchJob::Wait() {
  const Clock::time_point begun = Clock::now();
  Clock::time_point flushed;
  milliseconds tick = kFirstTick;
  std::unique_lock lock(mutex_);
  while (!ended_.wait_for(lock, tick, [this] { return running_ == 0; })) {
    lock.unlock();
    tick = kTick;
    if (stopping()) stack_.Abort();
    const Clock::time_point now = Clock::now();
    const auto interval =
        std::clamp(std::chrono::duration_cast<milliseconds>((now - begun) / kFlushShare),
                   kFlushInterval, kSlowestFlush);
    try {
      if (now - flushed >= interval) {
        Flush();
        flushed = now;
      }
      settings_.report(progress_);
    } catch (...) {
      Fail(std::current_exception());
    }
    lock.lock();
  }
}

void SearchJob::Flush() {
  for (const auto& thread : threads_) thread->Flush();
}

}  // namespace nas
