#include "arbory/picker.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "arbory/interrupt.h"
#include "arbory/options.h"
#include "arbory/rows.h"
#include "arbory/terminal.h"
#include "nas/base/paths.h"
#include "nas/base/unique_fd.h"

namespace arbory {
namespace {

// What fzf ends with where nothing was chosen because nothing was there.
constexpr int kNoMatch = 1;

// One word of the shell. fzf replaces {q} and its like before the shell sees them, so no brace may
// be followed by what would make one.
std::string ShellWord(const std::string& text) {
  std::string word = "'";
  for (const char c : text) {
    if (c == '\'') {
      word += "'\\''";
    } else {
      word += c;
      if (c == '{') word += "''";
    }
  }
  return word + "'";
}

struct Ends {
  nas::UniqueFd read;
  nas::UniqueFd write;
};

Ends MakePipe() {
  std::array<int, 2> ends;
  if (pipe2(ends.data(), O_CLOEXEC) != 0) {
    throw std::runtime_error(std::string("no pipe can be had: ") + std::strerror(errno));
  }
  return {nas::UniqueFd(ends[0]), nas::UniqueFd(ends[1])};
}

// In the terminal's process group, as the program that has the terminal while it runs.
pid_t StartFzf(const std::string& command, int input, int output) {
  // By its query nothing is filtered again. The first field is the path, for this program alone.
  std::vector<std::string> words = {
      "fzf",       "--disabled",     "--read0",
      "--print0",  "--delimiter=\t", "--with-nth=2..",
      "--reverse", "--prompt=find ", "--bind=change:reload:" + command};
  std::vector<char*> pointers;
  for (std::string& word : words) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  // The user's own shell may quote in another way than fzf does.
  setenv("SHELL", "/bin/sh", 1);
  posix_spawn_file_actions_t files;
  posix_spawnattr_t attributes;
  posix_spawn_file_actions_init(&files);
  posix_spawnattr_init(&attributes);
  posix_spawn_file_actions_adddup2(&files, input, STDIN_FILENO);
  posix_spawn_file_actions_adddup2(&files, output, STDOUT_FILENO);
  sigset_t defaults;
  sigemptyset(&defaults);
  sigaddset(&defaults, SIGPIPE);
  posix_spawnattr_setsigdefault(&attributes, &defaults);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF);
  pid_t child = -1;
  const int failed =
      posix_spawnp(&child, words.front().c_str(), &files, &attributes, pointers.data(), environ);
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&files);
  if (failed == ENOENT) {
    throw UsageError(
        "give words to look for; choosing while you type takes the program fzf (of "
        "the package fzf)");
  }
  if (failed != 0)
    throw std::runtime_error(std::string("cannot run fzf: ") + std::strerror(failed));
  return child;
}

// All that fzf says. An interrupt of this program is passed on, so that the terminal is given back.
std::string ReadChosen(int output, pid_t fzf) {
  std::string text;
  std::array<char, 4096> bytes;
  for (bool told = false;;) {
    const ssize_t count = read(output, bytes.data(), bytes.size());
    if (count > 0) text.append(bytes.data(), static_cast<size_t>(count));
    if (count == 0 || (count < 0 && errno != EINTR)) return text;
    if (Interrupted() && !told) kill(fzf, SIGTERM);
    told = Interrupted();
  }
}

int EndOf(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : kExitInterrupted;
}

}  // namespace

std::string ChoicesCommand(const std::string& program, const std::vector<std::string>& arguments) {
  std::string command = ShellWord(program);
  for (const std::string& argument : arguments) command += " " + ShellWord(argument);
  return command + " --choices -- {q}";  // quoted by fzf
}

int RunPicker(const PickerSettings& settings) {
  const auto program = nas::RealPath("/proc/self/exe");
  if (!program) throw std::runtime_error("this program's own file cannot be found");
  Ends input = MakePipe();
  Ends output = MakePipe();
  const pid_t fzf =
      StartFzf(ChoicesCommand(*program, settings.arguments), input.read.get(), output.write.get());
  input.read.Reset();
  output.write.Reset();
  WriteOut(input.write.get(), settings.first);  // it may have been left before it read all
  input.write.Reset();
  const std::string chosen = ReadChosen(output.read.get(), fzf);
  const int code = EndOf(fzf);
  if (code == kNoMatch) return kExitNothing;
  if (code != 0) return code == kExitInterrupted || Interrupted() ? kExitInterrupted : kExitError;
  std::string paths;
  for (size_t at = 0; at < chosen.size();) {
    const size_t end = std::min(chosen.find('\0', at), chosen.size());
    const std::string path = PathOfChoice(std::string_view(chosen).substr(at, end - at));
    if (!path.empty()) paths += path + settings.end;
    at = end + 1;
  }
  Print(paths);
  return paths.empty() ? kExitNothing : kExitSuccess;
}

}  // namespace arbory
