#include "arbory/interrupt.h"

#include <poll.h>
#include <signal.h>

#include <initializer_list>
#include <iterator>

namespace arbory {
namespace {

constexpr int kImpatient = 3;

int interrupted = 0;  // how often

void Note(int signal_number) {
  if (__atomic_add_fetch(&interrupted, 1, __ATOMIC_RELAXED) < kImpatient) return;
  signal(signal_number, SIG_DFL);
  raise(signal_number);  // held back until this returns
}

}  // namespace

void WatchForInterrupt() {
  struct sigaction note = {};
  note.sa_handler = Note;
  for (const int signal_number : {SIGINT, SIGTERM, SIGHUP}) {
    // What nohup or a shell's background job chose to ignore stays ignored.
    struct sigaction before = {};
    sigaction(signal_number, nullptr, &before);
    if (before.sa_handler != SIG_IGN) sigaction(signal_number, &note, nullptr);
  }
  signal(SIGPIPE, SIG_IGN);
}

bool Interrupted() { return __atomic_load_n(&interrupted, __ATOMIC_RELAXED) != 0; }

const int& InterruptFlag() { return interrupted; }

bool Pause(int milliseconds, int pidfd, int events) {
  pollfd awaited[] = {{pidfd, POLLIN, 0}, {events, POLLIN, 0}};
  return !Interrupted() && poll(awaited, std::size(awaited), milliseconds) == 0;
}

}  // namespace arbory
