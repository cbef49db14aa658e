#include "nas/system/lease.h"

namespace nas {
namespace {

bool g_leased = false;

}  // namespace

void LeaseNewTasks() { g_leased = true; }
bool NewTasksAreLeased() { return g_leased; }

}  // namespace nas
