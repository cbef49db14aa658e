#include "search/search_state.h"

#include <syslog.h>

#include <atomic>
#include <csignal>

#include "api/log.h"

OKT::Task* pTask = nullptr;
FileSearch::WfmSearchDBTask* dbTask = nullptr;
int termination_flag = 0;

static_assert(std::atomic_ref<int>::is_always_lock_free, "set from a signal handler");

bool StopRequested() {
  return std::atomic_ref<int>(termination_flag).load(std::memory_order_relaxed) == 1;
}

void DelSigHandler(int signal_number) {
  if (signal_number == SIGTERM) {
    std::atomic_ref<int>(termination_flag).store(1, std::memory_order_relaxed);
    return;
  }
  // Not reached from a signal: the handler is installed for SIGTERM alone.
  syslog(LOG_ERR, "%s:%d Unknown Signal: %d", kLogSource, log_line::kUnknownSignal, signal_number);
}
