#include "nas/index/watcher.h"

#include <sys/epoll.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <ctime>
#include <map>
#include <optional>

#include "nas/base/deadline.h"
#include "nas/index/client.h"
#include "nas/index/descriptors.h"
#include "nas/index/frames.h"
#include "nas/index/hints.h"
#include "nas/index/merge_policy.h"
#include "nas/index/table_check_child.h"
#include "nas/index/table_maker.h"
#include "nas/system/config.h"

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;

// Events come in bursts: gathered for so long, most of what they say is said once, and whoever
// makes them is not interrupted for each. Questions take what is there without waiting.
constexpr std::chrono::milliseconds kGather{20};
// A question waits for what happened before it; where that is more than can be taken in time, a
// search that walks is sooner.
constexpr int kBarrierMilliseconds = 100;
// Taken between two looks at the clock.
constexpr size_t kSliceOfEvents = size_t{256} << 10;
// Of all users together.
constexpr size_t kMostQuestions = 64;
// A file system that failed, or a disk that was full, is tried again.
constexpr std::chrono::seconds kFirstRetry{5};
constexpr std::chrono::seconds kLongestRetry{600};
constexpr std::chrono::seconds kBetweenGaps{5};
// The one before has nothing to wait for, but may be held up by its file system for long.
constexpr std::chrono::milliseconds kUntilOtherIsGone{100};
// A clean end waits so long for the last table; the broker a little longer.
constexpr int kEndMilliseconds = 15'000;

class Watcher {
 public:
  explicit Watcher(WatcherSetup setup)
      : setup_(std::move(setup)),
        figures_(*setup_.figures),
        hints_(static_cast<size_t>(CurrentConfig().index.max_changes)) {}

  int Run();

 private:
  enum class Mark : std::uint64_t { kBroker, kEvents, kSignals, kJob };

  bool MakeLoop();
  void Watch(int fd, Mark mark, std::uint32_t events);
  void Begin();
  int WaitTime(Clock::time_point now) const;
  void Handle(Mark mark);
  void Act(Clock::time_point now);
  void TakeEvents();
  void TakeSignals();
  void TakeMessages();
  void Reap();

  void StartJob(TableMaker::Kind kind);
  void EndJob();
  void Abandon();
  bool UseTable();
  void AfterSweep();
  void LoseTrack(Clock::time_point now);
  void AfterGap();
  void Rebuild();
  void Fail(int error);
  void Publish();
  void Finish();

  void Serve(Message& message);
  void Ask(Message& message);
  bool Barrier();
  void Refuse(const UniqueFd& connection, std::string_view words);

  WatcherSetup setup_;
  Figures& figures_;
  UniqueFd loop_;
  UniqueFd signals_;
  std::optional<Trees> trees_;
  std::optional<TableMaker> maker_;
  std::optional<NameTable> table_;
  Hints hints_;
  MergePolicy policy_;
  IndexState state_ = IndexState::kStarting;
  bool gathering_ = false;
  Clock::time_point gathered_;
  std::optional<Clock::time_point> retry_;
  Clock::duration patience_ = kFirstRetry;
  std::optional<Clock::time_point> gap_;
  std::map<pid_t, uid_t> questions_;
  bool ending_ = false;
  bool orphaned_ = false;
};

int Watcher::Run() {
  if (!MakeLoop()) return EXIT_FAILURE;
  Begin();
  while (!ending_) {
    Publish();
    std::array<epoll_event, 8> ready;
    const int count = epoll_wait(loop_.get(), ready.data(), static_cast<int>(ready.size()),
                                 WaitTime(Clock::now()));
    for (int at = 0; at < count; ++at)
      Handle(static_cast<Mark>(ready[static_cast<size_t>(at)].data.u64));
    Act(Clock::now());
  }
  Finish();
  return EXIT_SUCCESS;
}

bool Watcher::MakeLoop() {
  sigset_t noted;
  sigemptyset(&noted);
  for (const int signal_number : {SIGCHLD, SIGTERM, SIGINT}) sigaddset(&noted, signal_number);
  sigprocmask(SIG_BLOCK, &noted, nullptr);
  loop_.Reset(epoll_create1(EPOLL_CLOEXEC));
  signals_.Reset(signalfd(-1, &noted, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!loop_ || !signals_) return false;
  Watch(signals_.get(), Mark::kSignals, EPOLLIN);
  Watch(setup_.broker.get(), Mark::kBroker, EPOLLIN);
  return true;
}

void Watcher::Watch(int fd, Mark mark, std::uint32_t events) {
  epoll_event event = {};
  event.events = events;
  event.data.u64 = static_cast<std::uint64_t>(mark);
  if (epoll_ctl(loop_.get(), EPOLL_CTL_MOD, fd, &event) != 0 && errno == ENOENT) {
    epoll_ctl(loop_.get(), EPOLL_CTL_ADD, fd, &event);
  }
}

void Watcher::Begin() {
  const IndexSettings& settings = CurrentConfig().index;
  auto trees = Trees::Open(setup_.file_system, settings.modify_events);
  if (!trees) return Fail(trees.error().error_number);
  trees_ = std::move(*trees);
  figures_.by_folder = trees_->by_folder() != nullptr;
  auto maker = TableMaker::Make(setup_.file_system, setup_.folder, *trees_, figures_);
  if (!maker && maker.error().error_number == EWOULDBLOCK) {
    trees_.reset();
    retry_ = Clock::now() + kUntilOtherIsGone;
    return;
  }
  if (!maker) return Fail(maker.error().error_number);
  maker_.emplace(std::move(*maker));
  Watch(trees_->events().fd(), Mark::kEvents, EPOLLIN);
  // Watches on single folders end with the process, so what was kept would have to be read anyway.
  if (setup_.file_system.keeps && trees_->by_folder() == nullptr) {
    auto kept = maker_->OpenTable();
    if (kept) table_ = std::move(*kept);
  }
  AfterGap();
}

int Watcher::WaitTime(Clock::time_point now) const {
  std::optional<Clock::time_point> next = retry_;
  const auto earlier = [&next](Clock::time_point time) {
    if (!next || time < *next) next = time;
  };
  if (gathering_) earlier(gathered_);
  if (maker_ && !maker_->working() && table_) {
    const std::chrono::minutes at_most(CurrentConfig().index.rewrite_minutes);
    const auto due = policy_.Due(hints_, *table_, at_most);
    if (due) earlier(*due);
  }
  if (!next) return -1;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(*next - now).count();
  return static_cast<int>(std::clamp<decltype(left)>(left, 0, kEndMilliseconds));
}

void Watcher::Handle(Mark mark) {
  switch (mark) {
    case Mark::kBroker:
      return TakeMessages();
    case Mark::kSignals:
      return TakeSignals();
    case Mark::kJob:
      return EndJob();
    case Mark::kEvents:
      // Not looked at again before the time has passed.
      Watch(trees_->events().fd(), Mark::kEvents, 0);
      gathering_ = true;
      gathered_ = Clock::now() + kGather;
  }
}

void Watcher::Act(Clock::time_point now) {
  if (gathering_ && now >= gathered_) TakeEvents();
  if (hints_.lost() && (!retry_ || Answers(state_))) LoseTrack(now);
  if (retry_ && now >= *retry_) {
    retry_.reset();
    if (!trees_ || !maker_) {
      Begin();
    } else {
      AfterGap();
    }
  }
  if (!maker_ || maker_->working() || !table_ || !Answers(state_)) return;
  const std::chrono::minutes at_most(CurrentConfig().index.rewrite_minutes);
  const auto due = policy_.Due(hints_, *table_, at_most);
  if (due && now >= *due) StartJob(TableMaker::Kind::kMerge);
}

void Watcher::TakeEvents() {
  gathering_ = false;
  trees_->events().Take(kSliceOfEvents, hints_);
  Watch(trees_->events().fd(), Mark::kEvents, EPOLLIN);
}

void Watcher::TakeSignals() {
  signalfd_siginfo info;
  while (read(signals_.get(), &info, sizeof info) == sizeof info) {
    if (info.ssi_signo != SIGCHLD) ending_ = true;
  }
  Reap();
}

// Of questions alone: the maker waits for its own child.
void Watcher::Reap() {
  std::erase_if(questions_, [](const auto& question) {
    return waitpid(question.first, nullptr, WNOHANG) == question.first;
  });
}

void Watcher::StartJob(TableMaker::Kind kind) {
  // What is queued now belongs to the changes that the job looks up.
  trees_->events().Take(trees_->events().Waiting(), hints_);
  if (kind != TableMaker::Kind::kSweep) hints_.BeginTable();
  const Status started = maker_->Start(kind, table_ ? &*table_ : nullptr, hints_.changes());
  if (!started) {
    hints_.AbandonTable();
    return Fail(started.error().error_number);
  }
  Watch(maker_->fd(), Mark::kJob, EPOLLIN);
}

void Watcher::EndJob() {
  if (!maker_->Read()) return;
  epoll_ctl(loop_.get(), EPOLL_CTL_DEL, maker_->fd(), nullptr);
  const TableMaker::Kind kind = maker_->kind();
  const int error = maker_->Finish();
  figures_.work_ms = static_cast<std::uint64_t>(
      std::chrono::duration_cast<std::chrono::milliseconds>(maker_->took()).count());
  policy_.Made(Clock::now(), maker_->took());
  if (error != 0) {
    hints_.AbandonTable();
    return Fail(error);
  }
  if (kind == TableMaker::Kind::kSweep) return AfterSweep();
  if (!UseTable()) return;
  patience_ = kFirstRetry;
  if (kind != TableMaker::Kind::kMerge) {
    state_ = trees_->events().TellsAttributes() ? IndexState::kCurrent : IndexState::kNames;
  }
}

void Watcher::Abandon() {
  if (!maker_ || !maker_->working()) return;
  epoll_ctl(loop_.get(), EPOLL_CTL_DEL, maker_->fd(), nullptr);
  maker_->Abandon();
  hints_.AbandonTable();
}

bool Watcher::UseTable() {
  auto table = maker_->OpenTable();
  if (!table) {
    hints_.AbandonTable();
    Fail(table.error().error_number);
    return false;
  }
  InotifySource* by_folder = trees_->by_folder();
  // What came of folders that are watched since this table was begun is told now, and kept for it.
  if (by_folder != nullptr) by_folder->Adopt(maker_->TakeWatches(), hints_);
  table_ = std::move(*table);
  hints_.Use(&*table_);
  if (by_folder != nullptr) by_folder->Forget(*table_);
  for (const FolderKey& key : maker_->unwatched()) {
    const NameTable::FolderId id = table_->Find(key);
    if (id != NameTable::kNoFolder) hints_.AddFolder(id);
  }
  figures_.made_at = std::time(nullptr);
  if (!setup_.file_system.keeps) maker_->RemoveTable();
  return true;
}

void Watcher::AfterSweep() {
  for (const NameTable::FolderId id : maker_->changed_folders()) hints_.AddFolder(id);
  figures_.swept_at = std::time(nullptr);
  state_ = IndexState::kNames;
  if (!hints_.lost()) StartJob(TableMaker::Kind::kMergeAll);
}

// In a storm of events the next gap would come before the comparing is done: nothing is noted then
// for a while.
void Watcher::LoseTrack(Clock::time_point now) {
  const bool storm = gap_ && now - *gap_ < kBetweenGaps;
  gap_ = now;
  if (!storm) return AfterGap();
  Abandon();
  hints_.ForgetAll();
  hints_.Use(nullptr);
  state_ = table_ ? IndexState::kBehind : IndexState::kBuilding;
  retry_ = now + kBetweenGaps;
}

// Nothing is believed of what happened before now.
void Watcher::AfterGap() {
  retry_.reset();
  Abandon();
  hints_.ForgetAll();
  const bool compare = table_ && trees_->by_folder() == nullptr;
  state_ = compare ? IndexState::kBehind : IndexState::kBuilding;
  hints_.Use(compare ? &*table_ : nullptr);
  if (!compare) table_.reset();
  StartJob(compare ? TableMaker::Kind::kSweep : TableMaker::Kind::kScan);
}

void Watcher::Rebuild() {
  if (!trees_ || !maker_) return;
  hints_.Use(nullptr);
  table_.reset();
  AfterGap();
}

// What answers goes on to answer; the rest is tried again, in growing intervals.
void Watcher::Fail(int error) {
  figures_.error = error;
  if (!Answers(state_)) state_ = IndexState::kUnavailable;
  if (!trees_ || !maker_) {
    trees_.reset();
    maker_.reset();
  }
  const bool names_alone =
      state_ == IndexState::kNames && trees_ && trees_->events().TellsAttributes();
  if (state_ == IndexState::kUnavailable || names_alone) retry_ = Clock::now() + patience_;
  patience_ = std::min<Clock::duration>(patience_ * 2, kLongestRetry);
}

void Watcher::Publish() {
  figures_.state = state_;
  if (Answers(state_) && figures_.answers_since_ns == 0) {
    figures_.answers_since_ns = Clock::now().time_since_epoch() / std::chrono::nanoseconds(1);
  }
  figures_.events = hints_.events();
  figures_.changes = hints_.changes().size();
  figures_.entries = table_ ? table_->entries() : 0;
  figures_.folders = table_ ? table_->folders() : 0;
  figures_.table_bytes = table_ ? table_->bytes() : 0;
  const InotifySource* by_folder = trees_ ? trees_->by_folder() : nullptr;
  figures_.watches = by_folder == nullptr ? 0 : by_folder->watches();
}

// What was not written would be found by comparing, at the next start; it is sooner so. But where
// the broker was killed, the next one may have started already, and waits for this process to end.
void Watcher::Finish() {
  Abandon();
  const bool worth = !orphaned_ && setup_.file_system.keeps && Answers(state_) && table_ &&
                     maker_ && trees_->by_folder() == nullptr && hints_.changes().size() > 0;
  if (!worth) return;
  StartJob(TableMaker::Kind::kMerge);
  if (!maker_->working()) return;
  const Deadline deadline(kEndMilliseconds);
  while (!maker_->Read() && !deadline.passed()) maker_->Wait(deadline.left_ms());
}

void Watcher::TakeMessages() {
  for (;;) {
    Message message;
    const MessageState got = ReceiveMessage(setup_.broker.get(), &message);
    if (got == MessageState::kNone) return;
    if (got == MessageState::kEnded) {
      ending_ = orphaned_ = true;
      return;
    }
    Serve(message);
  }
}

void Watcher::Serve(Message& message) {
  switch (static_cast<HelloKind>(message.hello[0])) {
    case HelloKind::kRebuild:
      return Rebuild();
    case HelloKind::kCovered:
    case HelloKind::kQuestion:
    case HelloKind::kCheck:
      return Ask(message);
    case HelloKind::kReport:
      break;
  }
}

void Watcher::Refuse(const UniqueFd& connection, std::string_view words) {
  figures_.refused.fetch_add(1);
  // A fresh connection has room for a few words, and whoever does not take them walks.
  (void)SendFrame(connection.get(), FrameType::kStatus, words);
}

bool Watcher::Barrier() {
  EventSource& events = trees_->events();
  const Deadline deadline(kBarrierMilliseconds);
  size_t left = events.Waiting();
  while (left > 0) {
    const size_t taken = events.Take(std::min(left, kSliceOfEvents), hints_);
    if (taken == 0) break;
    left -= std::min(left, taken);
    if (left > 0 && deadline.passed()) return false;
  }
  return !hints_.lost();
}

void Watcher::Ask(Message& message) {
  const UniqueFd& connection = message.descriptors[0];
  if (!connection || !message.descriptors[1]) return;
  Publish();
  if (!Answers(state_)) return Refuse(connection, StateWords(figures_));
  const auto key = KeyOf(message.descriptors[1].get());
  if (!key || table_->Find(*key) == NameTable::kNoFolder) return Refuse(connection, "not indexed");
  const auto kind = static_cast<HelloKind>(message.hello[0]);
  if (kind == HelloKind::kCovered) {
    (void)SendFrame(connection.get(), FrameType::kStatus, kIndexCurrent);
    return;
  }
  auto peer = PeerOf(connection.get());
  if (!peer) return;
  const uid_t uid = peer->uid;
  const auto same = [&](const auto& question) { return question.second == uid; };
  if (questions_.size() >= kMostQuestions ||
      std::ranges::count_if(questions_, same) >= CurrentConfig().index.questions_per_user) {
    return Refuse(connection, "busy");
  }
  if (kind == HelloKind::kCheck && uid != 0 && uid != geteuid()) {
    return Refuse(connection, "not allowed");
  }
  if (!Barrier()) return Refuse(connection, "behind");
  const bool attributes = state_ == IndexState::kCurrent;
  pid_t pid = -1;
  if (kind == HelloKind::kCheck) {
    pid = StartCheck(connection.get(), *table_, hints_.changes(), attributes, RootsOf(*trees_));
  } else {
    const Question question = {connection.get(), message.descriptors[1].get(), std::move(*peer),
                               message.hello[1] == kHelloAsksTimes};
    pid = StartQuestion(question, *table_, hints_.changes(), attributes, setup_.answer);
  }
  if (pid < 0) return Refuse(connection, "busy");
  questions_.emplace(pid, uid);
  figures_.questions.fetch_add(1);
}

}  // namespace

int RunWatcher(WatcherSetup setup) { return Watcher(std::move(setup)).Run(); }

}  // namespace nas
