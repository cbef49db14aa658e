#include "nas/index/table_check_child.h"

#include <sys/prctl.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <string>

#include "nas/index/client.h"
#include "nas/index/frames.h"
#include "nas/index/table_compare.h"
#include "nas/system/child.h"

namespace nas {
namespace {

const char* WordsOf(TableDifference::Kind kind) {
  switch (kind) {
    case TableDifference::Kind::kMissing:
      return "not in the index";
    case TableDifference::Kind::kGone:
      return "gone";
    case TableDifference::Kind::kType:
      return "of another type";
    case TableDifference::Kind::kAttributes:
      return "other attributes";
    case TableDifference::Kind::kFolder:
      return "another folder";
    case TableDifference::Kind::kOrder:
      break;
  }
  return "the index contradicts itself";
}

void Compare(int connection, const NameTable& table, const Changes& changes, bool attributes,
             const std::vector<TableRoot>& roots) {
  if (!SendFrame(connection, FrameType::kStatus, kIndexCurrent)) return;
  std::uint64_t count = 0;
  const Status done = CompareTable(table, changes, attributes, roots, [&](const auto& difference) {
    ++count;
    const std::string& root = roots[difference.tree].name;
    const std::string path =
        difference.path.empty() ? root : (root == "/" ? root : root + "/") + difference.path;
    // Whoever has gone is noticed at the end.
    (void)SendFrame(connection, FrameType::kRows, path + ": " + WordsOf(difference.kind));
  });
  (void)SendFrame(connection, FrameType::kEnd, done ? std::to_string(count) : done.error().Text());
}

}  // namespace

pid_t StartCheck(int connection, const NameTable& table, const Changes& changes, bool attributes,
                 const std::vector<TableRoot>& roots) {
  const pid_t parent = getpid();
  const pid_t pid = fork();
  if (pid != 0) return pid;
  ResetSignals();
  OfferToOutOfMemoryKiller();
  // It holds the watcher's lock on the folder of tables, which the next watcher waits for.
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (getppid() != parent) _exit(EXIT_FAILURE);
  try {
    Compare(connection, table, changes, attributes, roots);
  } catch (...) {
    // The asker sees a connection that ends before its answer does.
  }
  _exit(EXIT_SUCCESS);
}

}  // namespace nas
