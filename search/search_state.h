#pragma once
// The process-wide state of the search API. A process serves one request, or is the worker of one
// search, so there is one of each.

#include "platform/filesearch.h"
#include "platform/task.h"

// The search task that the current request created or opened, or that this worker works on. Owned
// by the module; null until a method handler sets it. Deleted at the end of
// ArboryFindHandler::Process, which leaves the old address here: nothing reads it after that.
extern OKT::Task* pTask;

// The result database last opened. Set by listing, which leaves it open until the process ends,
// and by cleaning, which deletes it and resets this. Never set in a search worker.
extern FileSearch::WfmSearchDBTask* dbTask;

// 0, and 1 for good once the worker was told to stop. A plain int because the walker polls it
// through an int pointer; this module touches it only through StopRequested and DelSigHandler,
// atomically.
extern int termination_flag;

bool StopRequested();

// The worker's handler of SIGTERM: sets the flag and nothing else. Leaves errno as it was.
void DelSigHandler(int signal_number);
