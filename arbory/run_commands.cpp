#include "arbory/run_commands.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <thread>

#include "arbory/interrupt.h"
#include "arbory/terminal.h"

namespace arbory {
namespace {

// What the system takes for the words of a command and the environment, of which some is left for
// what it adds itself.
size_t MostBytes() {
  constexpr size_t kLeft = 4096;
  constexpr size_t kLeast = 16 * 1024;
  size_t taken = kLeft;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    taken += strlen(*entry) + 1 + sizeof(char*);
  }
  const auto most = static_cast<size_t>(std::max(sysconf(_SC_ARG_MAX), 0L));
  return most > taken + kLeast ? most - taken : kLeast;
}

size_t BytesOf(const std::string& word) { return word.size() + 1 + sizeof(char*); }

nas::UniqueFd MakeOutput() { return nas::UniqueFd(memfd_create("output", MFD_CLOEXEC)); }

bool CopyTo(int to, int from) {
  if (lseek(from, 0, SEEK_SET) != 0) return false;
  std::array<char, 64 * 1024> bytes;
  for (;;) {
    const ssize_t count = read(from, bytes.data(), bytes.size());
    if (count <= 0) return count == 0;
    if (!WriteOut(to, {bytes.data(), static_cast<size_t>(count)})) return false;
  }
}

// How a command is started, as the system wants it.
class Spawning {
 public:
  Spawning() {
    posix_spawn_file_actions_init(&files_);
    posix_spawnattr_init(&attributes_);
    sigset_t defaults;
    sigemptyset(&defaults);
    sigaddset(&defaults, SIGPIPE);
    posix_spawnattr_setsigdefault(&attributes_, &defaults);
    posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGDEF);
  }
  ~Spawning() {
    posix_spawn_file_actions_destroy(&files_);
    posix_spawnattr_destroy(&attributes_);
  }
  Spawning(const Spawning&) = delete;
  Spawning& operator=(const Spawning&) = delete;

  void Redirect(int output, int errors) {
    posix_spawn_file_actions_addopen(&files_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&files_, output, STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&files_, errors, STDERR_FILENO);
  }
  // errno's value; 0: it runs.
  int Run(std::vector<std::string>& words, pid_t* pid) const {
    std::vector<char*> pointers;
    for (std::string& word : words) pointers.push_back(word.data());
    pointers.push_back(nullptr);
    return posix_spawnp(pid, pointers.front(), &files_, &attributes_, pointers.data(), environ);
  }

 private:
  posix_spawn_file_actions_t files_;
  posix_spawnattr_t attributes_;
};

}  // namespace

CommandRunner::CommandRunner(const OutputOptions& options)
    : batch_(!options.exec_batch.empty()),
      jobs_(options.jobs > 0 ? options.jobs : std::max(1U, std::thread::hardware_concurrency())) {
  for (const std::string& word : batch_ ? options.exec_batch : options.exec) {
    words_.emplace_back(word);
  }
  const auto places = std::ranges::count_if(words_, &PathTemplate::has_places);
  if (places == 0) words_.emplace_back("{}");
  if (!batch_) return;
  if (places > 1) throw UsageError("--exec-batch takes one word with places for paths");
  if (words_.front().has_places()) throw UsageError("--exec-batch takes a program, not a path");
  most_bytes_ = MostBytes();
  for (const PathTemplate& word : words_) {
    if (word.has_places()) {
      path_word_ = static_cast<size_t>(&word - words_.data());
    } else {
      most_bytes_ -= std::min(most_bytes_, BytesOf(word.Of("")));
    }
  }
}

CommandRunner::~CommandRunner() {
  StopAll();
  WaitFor(1);
}

bool CommandRunner::Take(std::string_view paths) {
  while (!paths.empty()) {
    const std::string_view path = paths.substr(0, paths.find('\0'));
    paths.remove_prefix(std::min(paths.size(), path.size() + 1));
    if (broken_ || Interrupted()) return false;
    if (!(batch_ ? AddToBatch(path) : RunFor(path))) return false;
  }
  return true;
}

bool CommandRunner::Finish() {
  const bool ran = (broken_ || Interrupted() || RunBatch()) && WaitFor(1);
  return ran && !broken_ && !Interrupted();
}

bool CommandRunner::RunFor(std::string_view path) {
  std::vector<std::string> words;
  for (const PathTemplate& word : words_) words.push_back(word.Of(path));
  return WaitFor(jobs_) && Start(std::move(words), jobs_ == 1);
}

bool CommandRunner::AddToBatch(std::string_view path) {
  std::string word = words_[path_word_].Of(path);
  if (path_bytes_ + BytesOf(word) > most_bytes_ && !RunBatch()) return false;
  path_bytes_ += BytesOf(word);
  paths_.push_back(std::move(word));
  return true;
}

bool CommandRunner::RunBatch() {
  if (paths_.empty()) return true;
  std::vector<std::string> words;
  for (size_t i = 0; i < words_.size(); ++i) {
    if (i == path_word_) {
      std::ranges::move(paths_, std::back_inserter(words));
    } else {
      words.push_back(words_[i].Of(""));
    }
  }
  paths_.clear();
  path_bytes_ = 0;
  return Start(std::move(words), true) && WaitFor(1);
}

bool CommandRunner::Start(std::vector<std::string> words, bool has_terminal) {
  Job job;
  Spawning spawning;
  if (!has_terminal) {
    job.output = MakeOutput();
    job.errors = MakeOutput();
    if (!job.output || !job.errors) return Failed(errno);
    spawning.Redirect(job.output.get(), job.errors.get());
  }
  if (const int failed = spawning.Run(words, &job.pid); failed != 0) {
    Complain("cannot run '" + words.front() + "': " + std::strerror(failed));
    all_succeeded_ = false;
    broken_ = true;
    return false;
  }
  job.ended.Reset(static_cast<int>(syscall(SYS_pidfd_open, job.pid, 0)));
  running_.push_back(std::move(job));
  return true;
}

bool CommandRunner::WaitFor(size_t most) {
  bool written = true;
  for (bool stopping = false; running_.size() >= most;) {
    std::vector<pollfd> ends;
    for (const Job& job : running_) ends.push_back({job.ended.get(), POLLIN, 0});
    if (Interrupted() && !std::exchange(stopping, true)) StopAll();
    if (poll(ends.data(), ends.size(), -1) < 0) continue;
    for (size_t i = ends.size(); i-- > 0;) {
      if (ends[i].revents == 0) continue;
      Job job = std::move(running_[i]);
      running_.erase(running_.begin() + static_cast<std::ptrdiff_t>(i));
      written &= End(std::move(job));
    }
  }
  return written;
}

bool CommandRunner::End(Job job) {
  int status = 0;
  while (waitpid(job.pid, &status, 0) < 0 && errno == EINTR) {
  }
  all_succeeded_ &= WIFEXITED(status) && WEXITSTATUS(status) == 0;
  if (!job.output) return true;
  const bool passed_on = CopyTo(STDOUT_FILENO, job.output.get()) || Failed(errno);
  CopyTo(STDERR_FILENO, job.errors.get());
  return passed_on;
}

bool CommandRunner::Failed(int error_number) {
  if (failure_ == 0) failure_ = error_number;
  return false;
}

void CommandRunner::StopAll() {
  for (const Job& job : running_) kill(job.pid, SIGTERM);
}

}  // namespace arbory
