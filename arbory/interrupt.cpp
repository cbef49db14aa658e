#include "arbory/interrupt.h"

#include <poll.h>
#include <signal.h>

#include <initializer_list>
#include <iterator>

namespace arbory {
namespace {

int interrupted = 0;

void Note(int) { __atomic_store_n(&interrupted, 1, __ATOMIC_RELAXED); }

}  // namespace

void WatchForInterrupt() {
  struct sigaction note = {};
  note.sa_handler = Note;
  note.sa_flags = static_cast<int>(SA_RESETHAND);
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
