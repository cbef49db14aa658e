#pragma once
// The process that keeps the index of one file system: one thread, which never waits for a file
// system itself. It takes events, has children read folders and write tables (TableJob), and forks
// a child for each question (question_child.h).
//
//   no table            scan, then names and attributes are current
//   a table was kept    compare all folders with it, then names are current; then read all
//                       attributes anew, then they are
//   events were lost    the same
//   changes add up      a table from the old one and the changes, while questions go on
//
// Events are asked for before anything is read and are kept while it is read, so that nothing that
// happens meanwhile is missed.
//
// Protocol with the broker, on a SOCK_SEQPACKET: a message of kHelloBytes bytes as the asker sent
// it, with its connection and, where it sent one, its location (SCM_RIGHTS). kRebuild comes without
// either. Nothing goes back; figures are read from shared memory.

#include <memory>
#include <string>

#include "nas/base/unique_fd.h"
#include "nas/index/figures.h"
#include "nas/index/question_child.h"
#include "nas/index/trees.h"

namespace nas {

struct WatcherSetup {
  FileSystem file_system;
  std::string folder;  // its table's; made, 0700
  UniqueFd broker;
  Figures* figures = nullptr;  // shared with the broker
  AnswerFunction answer;
};

// Begins once no other watcher has the same folder, whose broker may have been killed. Runs until
// SIGTERM, writing the table anew where something has changed since it was, or until the broker is
// gone. For a process of its own with one thread. Returns its exit status.
int RunWatcher(WatcherSetup setup);

}  // namespace nas
