// Words for the shell, and running a shell command confined by bubblewrap. The command sees
//
//   /usr /bin /sbin /lib* /etc    the system's own, read-only
//   /dev                          null, zero, random and the like
//   /volumeN/@tmp                 each volume's temporary folder, writable
//   /volume0/@tmp                 the scratch volume's
//
// and nothing else: no home, no share, no network, no other process. A volume that is not itself
// called /volume-something appears under an unused /volumeN, so that "/volume*" reaches it.

#include "nas/system/confine.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/json_text.h"
#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"
#include "nas/system/identity.h"
#include "nas/system/volumes.h"
#include "platform/system.h"

namespace nas {
namespace {

constexpr char kBubblewrap[] = "/usr/bin/bwrap";
// For emptying a folder of result files; longer takes only what will never end.
constexpr std::chrono::minutes kPatience{10};
constexpr std::chrono::milliseconds kLook{50};
constexpr char kCommandPath[] = "/usr/bin:/bin";
constexpr const char* kSystemFolders[] = {"/usr",   "/bin",   "/sbin",   "/lib",
                                          "/lib32", "/lib64", "/libx32", "/etc"};

bool IsFolder(const std::string& path) {
  struct stat info;
  return lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

class CommandLine {
 public:
  void Add(std::initializer_list<std::string> words) { words_.insert(words_.end(), words); }

  // Pointers into this object, with the final null.
  std::vector<char*> Pointers() {
    std::vector<char*> pointers;
    for (std::string& word : words_) pointers.push_back(word.data());
    pointers.push_back(nullptr);
    return pointers;
  }

 private:
  std::vector<std::string> words_;
};

// Binds the temporary folder of every volume that has one.
void AddVolumes(CommandLine* line) {
  for (const auto& [volume, name] : NamesInSandbox(ListVolumes(), ScratchVolume())) {
    const std::string folder = volume + "/" + kTemporaryFolder;
    if (IsFolder(folder)) line->Add({"--bind", folder, name + "/" + kTemporaryFolder});
  }
}

CommandLine Confine(const std::vector<const char*>& command, int status_fd) {
  CommandLine line;
  // It does not die with its parent: half of it would, and leave the other half, which waits for
  // that one while they begin, behind for ever. Its work ends by itself.
  line.Add({kBubblewrap, "--unshare-all", "--new-session", "--clearenv", "--setenv", "PATH",
            kCommandPath, "--json-status-fd", std::to_string(status_fd)});
  for (const char* folder : kSystemFolders) line.Add({"--ro-bind-try", folder, folder});
  line.Add({"--dev", "/dev"});
  AddVolumes(&line);
  line.Add({"--remount-ro", "/", "--chdir", "/", "--"});
  for (const char* word : command) line.Add({word});
  return line;
}

// bubblewrap's own failures and the command's exit status share one number; only its status
// report, one JSON object a line, tells whether the command ran to its end.
constexpr char kExitCode[] = "exit-code";
// The first process within, whose end is that of all the others there.
constexpr char kInnerProcess[] = "child-pid";

// -1 where nothing of that name was reported.
int Reported(const std::string& report, const char* name) {
  size_t start = 0;
  while (start < report.size()) {
    size_t end = report.find('\n', start);
    if (end == std::string::npos) end = report.size();
    Json::Value line;
    if (ParseJson(report.substr(start, end - start), &line) && line.isObject() &&
        line[name].isInt()) {
      return line[name].asInt();
    }
    start = end + 1;
  }
  return -1;
}

bool HasEnded(pid_t child) {
  siginfo_t info{};
  return waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT | WNOHANG) == 0 &&
         info.si_pid == child;
}

// Waits until `child` has ended; false when it did not in time. Where no descriptor can be had that
// tells of its end, looking again and again does.
bool WaitForEnd(pid_t child) {
  const UniqueFd process(static_cast<int>(syscall(SYS_pidfd_open, child, 0)));
  const auto end = std::chrono::steady_clock::now() + kPatience;
  while (!HasEnded(child)) {
    if (std::chrono::steady_clock::now() >= end) return false;
    pollfd ended{process.get(), POLLIN, 0};
    poll(&ended, 1, static_cast<int>(kLook.count()));
  }
  return true;
}

std::string ReadAll(int fd) {
  std::string text(static_cast<size_t>(std::max<off_t>(0, lseek(fd, 0, SEEK_END))), '\0');
  const ssize_t count = Uninterrupted([&] { return pread(fd, text.data(), text.size(), 0); });
  text.resize(static_cast<size_t>(std::max<ssize_t>(0, count)));
  return text;
}

// Both of bubblewrap's processes: the outer one, and the inner one, which waits for ever where the
// outer one is killed while they begin, and leaves its process group only after that.
void Kill(pid_t child, const std::string& report) {
  const int inner = Reported(report, kInnerProcess);
  if (inner > 0) kill(inner, SIGKILL);
  kill(-child, SIGKILL);
}

Result<int> RunConfined(const std::vector<const char*>& command) {
  // Not a pipe: should this process be killed, bubblewrap would fail to write to it and end while
  // its inner half waits for it.
  const UniqueFd status(memfd_create("status", MFD_CLOEXEC));
  if (!status) return ErrnoError();
  if (!CanConfine()) return ErrnoError(kBubblewrap);
  CommandLine line = Confine(command, status.get());
  const std::vector<char*> words = line.Pointers();
  const pid_t child = fork();
  if (child < 0) return ErrnoError();
  // By both, since neither knows which of them runs first.
  setpgid(child, child);
  if (child == 0) {
    GiveUpRoot();
    // Kept open for bubblewrap alone, which closes it before it runs the command.
    if (fcntl(status.get(), F_SETFD, 0) == 0) execv(kBubblewrap, words.data());
    _exit(EXIT_FAILURE);
  }
  const bool ended = WaitForEnd(child);
  const std::string text = ReadAll(status.get());
  if (!ended || Reported(text, kExitCode) < 0) Kill(child, text);
  Uninterrupted([&] { return waitpid(child, nullptr, 0); });
  const int code = Reported(text, kExitCode);
  if (code < 0) return Error{kErrorOther, 0, kBubblewrap};
  return code;
}

Result<int> RunForGood(const char* program, const std::vector<const char*>& command) {
  const bool there = program != nullptr && access(program, X_OK) == 0;
  Result<int> status = there ? RunConfined(command) : ErrnoError();
  // A folder that root made is the user's to empty, yet only root can take it away.
  if (CanBeRoot() && ActingAccount()) RemoveEmptyResultFolders(ActingAccount()->name);
  GiveUpRoot();
  return status;
}

}  // namespace

bool CanConfine() { return access(kBubblewrap, X_OK) == 0; }

}  // namespace nas

int NLIBCExec(const char* program, const char* arg1, const char* arg2, const char* arg3,
              int /*flags*/) {
  std::vector<const char*> command = {program};
  for (const char* argument : {arg1, arg2, arg3}) {
    if (argument == nullptr) break;
    command.push_back(argument);
  }
  const nas::Result<int> status = nas::RunForGood(program, command);
  if (status) return *status;
  nas::Report(status.error());
  return -1;
}

// Within single quotes the shell gives no byte a meaning, so only a single quote itself must step
// outside them.
int NLIBCEncShParam(const char* text, char* buffer, size_t size) {
  if (text == nullptr || buffer == nullptr) return -1;
  std::string word = "'";
  for (const char* at = text; *at != '\0'; ++at) {
    if (*at == '\'') {
      word += "'\\''";
    } else {
      word += *at;
    }
  }
  word += '\'';
  if (word.size() + 1 > size) return -1;
  std::memcpy(buffer, word.c_str(), word.size() + 1);
  return 0;
}
