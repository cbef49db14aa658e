#pragma once
// Ctrl-C and its kin, noticed instead of obeyed at once, so that a search can be stopped and
// cleaned up first.

namespace arbory {

// From now on SIGINT, SIGTERM and SIGHUP are noted, and the third ends the program at once. Not the
// second: timeout(1) and shells send one to the program and the same to its process group. A reader
// that went away is a failed write instead of a signal.
void WatchForInterrupt();
bool Interrupted();
// The same for what looks at a flag, atomically: not 0 once interrupted.
const int& InterruptFlag();

// Waits; an interrupt ends the wait early, and so does the end of the process that `pidfd` stands
// for, or something to be read from `events` (-1: none). Returns whether the wait lasted to its
// end.
bool Pause(int milliseconds, int pidfd, int events = -1);

}  // namespace arbory
