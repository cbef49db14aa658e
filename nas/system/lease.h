#pragma once
// Whether the searches that this process begins end by themselves once nobody asks after them. That
// is not a parameter of any call: who makes one says it of the process that serves it.

namespace nas {

// For the rest of the process and what it forks. For one thread.
void LeaseNewTasks();
bool NewTasksAreLeased();

}  // namespace nas
