#include "arbory/server/transport/children.h"

#include <unistd.h>

#include <fstream>
#include <string>

namespace arbory {

std::vector<pid_t> ChildrenOfThisProcess() {
  // The program has one thread, so all its children are that thread's.
  std::ifstream list("/proc/self/task/" + std::to_string(getpid()) + "/children");
  std::vector<pid_t> children;
  for (pid_t pid; list >> pid;) children.push_back(pid);
  return children;
}

}  // namespace arbory
