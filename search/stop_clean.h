#pragma once
// Ending a search's worker.

// Sends the worker SIGTERM. False when `pid` is none, when the worker has ended already, or when it
// may not be signalled.
bool KillSearchWorker(int pid);
