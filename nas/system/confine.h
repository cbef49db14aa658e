#pragma once
// Running the commands that clean up, confined by bubblewrap.

namespace nas {

// Whether bubblewrap is installed. Without it no such command runs: what it should have removed
// stays, and each attempt is a line in the system's log.
bool CanConfine();

}  // namespace nas
