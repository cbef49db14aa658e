#include "nas/index/broker.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <ctime>
#include <list>
#include <memory>
#include <optional>
#include <vector>

#include "nas/base/deadline.h"
#include "nas/base/file_lock.h"
#include "nas/index/daemon_socket.h"
#include "nas/index/frames.h"
#include "nas/index/index_plan.h"
#include "nas/index/index_report.h"
#include "nas/index/mounts.h"
#include "nas/index/table_folders.h"
#include "nas/index/watcher.h"
#include "nas/index/watcher_process.h"
#include "nas/system/child.h"
#include "nas/system/config.h"
#include "nas/system/folders.h"

namespace nas {
namespace {

using Clock = std::chrono::steady_clock;

constexpr char kLock[] = "lock";
constexpr size_t kMostWaiting = 64;
// Whoever connects sends its two bytes at once.
constexpr int kHelloMilliseconds = 1000;
// Accepted in one go, before others have their turn.
constexpr int kMostAccepted = 16;
// Mounts come several at a time.
constexpr std::chrono::milliseconds kAfterMount{500};
constexpr std::chrono::minutes kBetweenPlans{5};
constexpr std::chrono::seconds kAfterFailedPlan{5};
// A file server that does not answer may take minutes; what is known of the others goes on.
constexpr std::chrono::seconds kPlanPatience{60};
// For watchers to write their tables, a little longer than they take for it.
constexpr int kEndMilliseconds = 17'000;
constexpr size_t kPlanPiece = size_t{64} << 10;

class Broker {
 public:
  explicit Broker(const AnswerFunction& answer) : answer_(answer) {}
  Status Begin();
  void Run();

 private:
  enum Mark : std::uint64_t { kListener, kSignals, kMounts, kPlan, kFirstConnection };

  struct Waiting {
    std::uint64_t mark;
    UniqueFd connection;
    Clock::time_point until;
  };

  Status TakeLock();
  void Watch(int fd, std::uint64_t mark, std::uint32_t events);
  int WaitTime();
  void Handle(std::uint64_t mark);
  void Act();

  void TakeSignals();
  void Accept();
  void Hear(std::uint64_t mark);
  void Serve(Message& message);
  void HandOver(Message& message);
  void Report(const UniqueFd& connection);
  void Rebuild(const UniqueFd& connection);
  WatcherProcess* WatcherOf(int location);

  void StartPlan();
  void ReadPlan();
  void FailPlan();
  void EndPlan();
  void Follow(Plan plan);
  void StartWatchers();
  void EndWatchers();
  [[noreturn]] void BecomeWatcher(const WatcherProcess& watcher, UniqueFd channel,
                                  Figures* figures);

  const AnswerFunction& answer_;
  UniqueFd loop_;
  UniqueFd signals_;
  UniqueFd listener_;
  UniqueFd lock_;
  UniqueFd mounts_;
  std::list<Waiting> waiting_;  // the oldest first
  std::uint64_t next_mark_ = kFirstConnection;
  std::vector<std::unique_ptr<WatcherProcess>> watchers_;
  std::vector<Plan::LeftOut> left_out_;
  Child planner_;
  ReplyReader plan_head_;
  std::string plan_text_;
  bool plan_has_head_ = false;
  bool planned_ = false;  // once
  Clock::time_point plan_begun_;
  Clock::time_point next_plan_;
  bool ending_ = false;
};

Status Broker::TakeLock() {
  const std::string folder = TablesFolder();
  const Status made =
      MakeFolders(CurrentConfig().state_dir, S_IRWXU | S_IRGRP | S_IXGRP | S_IROTH | S_IXOTH);
  if (!made) return made;
  const Status own = MakeFolders(folder, S_IRWXU);
  if (!own) return own;
  const UniqueFd opened(open(folder.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!opened) return ErrnoError(folder);
  const Status closed = CheckPrivateTo(opened.get(), geteuid());
  if (!closed) return closed.error().Of(folder);
  lock_.Reset(
      openat(opened.get(), kLock, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
  struct flock lock = WriteLockOn(0);
  if (lock_ && fcntl(lock_.get(), F_OFD_SETLK, &lock) == 0) return {};
  return ErrnoError(lock_ ? EADDRINUSE : errno, folder);
}

Status Broker::Begin() {
  const Status locked = TakeLock();
  if (!locked) return locked;
  auto listener = ListenForIndex(OwnIndexSocket());
  if (!listener) return listener.error();
  listener_ = std::move(*listener);
  sigset_t noted;
  sigemptyset(&noted);
  for (const int number : {SIGCHLD, SIGTERM, SIGINT, SIGHUP}) sigaddset(&noted, number);
  sigprocmask(SIG_BLOCK, &noted, nullptr);
  signal(SIGPIPE, SIG_IGN);
  signals_.Reset(signalfd(-1, &noted, SFD_CLOEXEC | SFD_NONBLOCK));
  loop_.Reset(epoll_create1(EPOLL_CLOEXEC));
  mounts_.Reset(open(kMountInfo, O_RDONLY | O_CLOEXEC));
  if (!signals_ || !loop_ || !mounts_) return ErrnoError();
  Watch(listener_.get(), kListener, EPOLLIN);
  Watch(signals_.get(), kSignals, EPOLLIN);
  Watch(mounts_.get(), kMounts, EPOLLPRI | EPOLLERR | EPOLLET);
  StartPlan();
  return {};
}

void Broker::Watch(int fd, std::uint64_t mark, std::uint32_t events) {
  epoll_event event = {};
  event.events = events;
  event.data.u64 = mark;
  epoll_ctl(loop_.get(), EPOLL_CTL_ADD, fd, &event);
}

void Broker::Run() {
  constexpr size_t kAtOnce = 32;
  while (!ending_) {
    std::array<epoll_event, kAtOnce> ready;
    const int count = epoll_wait(loop_.get(), ready.data(), kAtOnce, WaitTime());
    for (int at = 0; at < count; ++at) Handle(ready[static_cast<size_t>(at)].data.u64);
    Act();
  }
  EndWatchers();
  // Nobody finds a socket that nobody listens at.
  unlink(OwnIndexSocket().c_str());
}

int Broker::WaitTime() {
  Clock::time_point next = planner_.pid >= 0 ? plan_begun_ + kPlanPatience : next_plan_;
  if (!waiting_.empty()) next = std::min(next, waiting_.front().until);
  for (const auto& watcher : watchers_) next = std::min(next, watcher->next_start().value_or(next));
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(next - Clock::now()).count();
  return static_cast<int>(std::max<decltype(left)>(left, 0));
}

void Broker::Handle(std::uint64_t mark) {
  switch (mark) {
    case kListener:
      return Accept();
    case kSignals:
      return TakeSignals();
    case kMounts:
      next_plan_ = std::min(next_plan_, Clock::now() + kAfterMount);
      return;
    case kPlan:
      return ReadPlan();
    default:
      return Hear(mark);
  }
}

void Broker::Act() {
  const Clock::time_point now = Clock::now();
  while (!waiting_.empty() && waiting_.front().until <= now) waiting_.pop_front();
  if (planner_.pid >= 0 && now >= plan_begun_ + kPlanPatience) FailPlan();
  if (planner_.pid < 0 && now >= next_plan_) StartPlan();
  StartWatchers();
}

void Broker::TakeSignals() {
  signalfd_siginfo info;
  while (read(signals_.get(), &info, sizeof info) == sizeof info) {
    if (info.ssi_signo == SIGHUP) next_plan_ = Clock::now();
    if (info.ssi_signo == SIGTERM || info.ssi_signo == SIGINT) ending_ = true;
  }
  for (const auto& watcher : watchers_) {
    if (watcher->running() && waitpid(watcher->pid(), nullptr, WNOHANG) == watcher->pid()) {
      watcher->Ended(watcher->pid());
    }
  }
}

void Broker::Accept() {
  for (int accepted = 0; accepted < kMostAccepted; ++accepted) {
    UniqueFd connection(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!connection) return;
    if (waiting_.size() == kMostWaiting) waiting_.pop_front();
    Watch(connection.get(), next_mark_, EPOLLIN);
    waiting_.push_back({next_mark_++, std::move(connection),
                        Clock::now() + std::chrono::milliseconds(kHelloMilliseconds)});
  }
}

void Broker::Hear(std::uint64_t mark) {
  const auto found = std::ranges::find(waiting_, mark, &Waiting::mark);
  if (found == waiting_.end()) return;
  Message received;
  const MessageState state = ReceiveMessage(found->connection.get(), &received);
  if (state == MessageState::kNone) return;
  // Closing does not end that where a watcher's child holds the connection too: what the peer has
  // sent it would wake this process, over and over, for as long as the answer takes.
  epoll_ctl(loop_.get(), EPOLL_CTL_DEL, found->connection.get(), nullptr);
  Message message;
  message.hello = received.hello;
  message.descriptors = {std::move(found->connection), std::move(received.descriptors[0])};
  waiting_.erase(found);
  if (state == MessageState::kMessage) Serve(message);
}

void Broker::Serve(Message& message) {
  switch (static_cast<HelloKind>(message.hello[0])) {
    case HelloKind::kQuestion:
    case HelloKind::kCovered:
    case HelloKind::kCheck:
      return HandOver(message);
    case HelloKind::kReport:
      return Report(message.descriptors[0]);
    case HelloKind::kRebuild:
      return Rebuild(message.descriptors[0]);
  }
}

WatcherProcess* Broker::WatcherOf(int location) {
  const auto place = PlaceOf(location);
  if (!place) return nullptr;
  const auto holds = [](const std::string& number) {
    return [&number](const auto& watcher) {
      const FileSystem& found = watcher->file_system();
      return found.device == number ||
             std::ranges::find(found.numbers, number) != found.numbers.end();
    };
  };
  auto watcher = std::ranges::find_if(watchers_, holds(place->number));
  // A subvolume that is no tree of its own has a number that only its mount leads away from.
  if (watcher == watchers_.end() && place->number.starts_with("0:")) {
    if (const auto mount = FindMount(place->mount_id)) {
      watcher = std::ranges::find_if(watchers_, holds(mount->device));
    }
  }
  return watcher == watchers_.end() ? nullptr : watcher->get();
}

void Broker::HandOver(Message& message) {
  const int connection = message.descriptors[0].get();
  const int location = message.descriptors[1].get();
  if (location < 0) return;
  const WatcherProcess* watcher = WatcherOf(location);
  if (watcher == nullptr) {
    const bool known = planned_ && planner_.pid < 0;
    (void)SendFrame(connection, FrameType::kStatus, known ? "not indexed" : "starting");
    return;
  }
  // Nobody waits behind one who is told to walk.
  if (!Answers(watcher->figures().state)) {
    (void)SendFrame(connection, FrameType::kStatus, StateWords(watcher->figures()));
    return;
  }
  fcntl(connection, F_SETFL, fcntl(connection, F_GETFL) & ~O_NONBLOCK);
  const std::array<int, 2> descriptors = {connection, location};
  if (!watcher->Send(message.hello, descriptors)) {
    (void)SendFrame(connection, FrameType::kStatus, "busy");
  }
}

bool IsMaster(const UniqueFd& connection) {
  const auto peer = PeerOf(connection.get());
  return peer && (peer->uid == 0 || peer->uid == geteuid());
}

void Broker::Report(const UniqueFd& connection) {
  std::vector<const WatcherProcess*> watchers;
  for (const auto& watcher : watchers_) watchers.push_back(watcher.get());
  (void)SendFrame(connection.get(), FrameType::kStatus,
                  IndexReport(watchers, left_out_, planned_, IsMaster(connection)));
}

void Broker::Rebuild(const UniqueFd& connection) {
  if (!IsMaster(connection)) {
    (void)SendFrame(connection.get(), FrameType::kStatus, "not allowed");
    return;
  }
  const Hello hello = {static_cast<char>(HelloKind::kRebuild), '\0'};
  bool all = true;
  for (const auto& watcher : watchers_) all = watcher->Send(hello, {}) && all;
  (void)SendFrame(connection.get(), FrameType::kStatus, all ? "rebuilding" : "busy");
}

void Broker::StartPlan() {
  plan_head_ = ReplyReader();
  plan_has_head_ = false;
  plan_text_.clear();
  plan_begun_ = Clock::now();
  next_plan_ = plan_begun_ + kBetweenPlans;
  planner_ = StartChild([](int pipe) {
    const Plan plan = MakePlan();
    SweepTableFolders(plan, std::time(nullptr));  // before, as the reply is this process's end
    SendReply(pipe, {{}, PlanText(plan)});
  });
  if (planner_.pid < 0) return FailPlan();
  Watch(planner_.fd.get(), kPlan, EPOLLIN);
}

void Broker::ReadPlan() {
  if (planner_.pid < 0) return;
  std::array<char, kPlanPiece> piece;
  const ssize_t got = read(planner_.fd.get(), piece.data(), piece.size());
  if (got <= 0) return FailPlan();
  const std::string_view bytes(piece.data(), static_cast<size_t>(got));
  if (plan_has_head_) {
    plan_text_.append(bytes);
  } else {
    const ReplyReader::State state = plan_head_.Feed(bytes);
    if (state == ReplyReader::State::kBroken) return FailPlan();
    if (state == ReplyReader::State::kMore) return;
    plan_has_head_ = true;
    plan_text_ = plan_head_.body_begin();
  }
  if (plan_text_.size() < plan_head_.body_bytes()) return;
  Plan plan;
  const bool sound = ParsePlan(plan_text_, &plan);
  if (!sound) return FailPlan();
  EndPlan();
  planned_ = true;
  Follow(std::move(plan));
}

// What was not found out is tried again soon: file systems that nobody knows of yet are walked.
void Broker::FailPlan() {
  if (planner_.pid >= 0) EndPlan();
  next_plan_ = std::min(next_plan_, Clock::now() + kAfterFailedPlan);
}

void Broker::EndPlan() {
  planner_.fd.Reset();
  kill(planner_.pid, SIGKILL);
  waitpid(planner_.pid, nullptr, 0);
  planner_.pid = -1;
}

void Broker::Follow(Plan plan) {
  left_out_ = std::move(plan.left_out);
  std::erase_if(watchers_, [&](const auto& watcher) {
    return std::ranges::find(plan.file_systems, watcher->file_system()) == plan.file_systems.end();
  });
  for (FileSystem& found : plan.file_systems) {
    const auto same = [&](const auto& watcher) { return watcher->file_system() == found; };
    if (std::ranges::any_of(watchers_, same)) continue;
    watchers_.push_back(std::make_unique<WatcherProcess>(std::move(found)));
  }
}

void Broker::StartWatchers() {
  for (const auto& watcher : watchers_) {
    watcher->Start([&](UniqueFd channel, Figures* figures) {
      BecomeWatcher(*watcher, std::move(channel), figures);
    });
  }
}

// What is the broker's own is closed; the other watchers' figures stay mapped and are not looked
// at.
void Broker::BecomeWatcher(const WatcherProcess& watcher, UniqueFd channel, Figures* figures) {
  WatcherSetup setup;
  setup.file_system = watcher.file_system();
  setup.folder = TableFolder(setup.file_system);
  // Above every number that the broker has, so that the rest can go at once.
  setup.broker = std::move(channel);
  setup.figures = figures;
  setup.answer = answer_;
  const auto kept = static_cast<unsigned>(setup.broker.get());
  if (kept > STDERR_FILENO + 1) close_range(STDERR_FILENO + 1, kept - 1, 0);
  close_range(kept + 1, ~0U, 0);
  _exit(RunWatcher(std::move(setup)));
}

void Broker::EndWatchers() {
  listener_.Reset();
  waiting_.clear();
  for (const auto& watcher : watchers_) watcher->AskToEnd();
  const Deadline deadline(kEndMilliseconds);
  const auto running = [](const auto& watcher) { return watcher->running(); };
  while (std::ranges::any_of(watchers_, running) && !deadline.passed()) {
    epoll_event event;
    epoll_wait(loop_.get(), &event, 1, deadline.left_ms());
    TakeSignals();
  }
  watchers_.clear();
}

}  // namespace

Status RunIndexDaemon(const AnswerFunction& answer, const std::function<void()>& on_ready) {
  Broker broker(answer);
  const Status begun = broker.Begin();
  if (!begun) return begun;
  on_ready();
  broker.Run();
  return {};
}

}  // namespace nas
