#pragma once
// Asking the index daemon (`arbory index`). The asker connects as the user it is; the daemon takes
// from the kernel who that is and answers with a process that has become that very user.
//
// Protocol, on a connected socket of the local machine:
//
//   asker    the hello: kHelloBytes bytes (HelloKind, flags), with one descriptor (SCM_RIGHTS)
//   where
//            it is about a location: the folder, O_PATH will do
//   daemon   a frame kStatus: kIndexCurrent, or a few words why there is no answer, and the end
//
// After kIndexCurrent, for a question, as index_answer.h of nas/search has it:
//
//   asker    a frame kQuestion
//   daemon   frames, the last of them kEnd
//
// Whoever closes the connection ends the question. Any thread may call.

#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"

namespace nas {

inline constexpr std::string_view kIndexCurrent = "current";

// The first byte of the hello tells the protocol too: an unknown one is not answered.
enum class HelloKind : char {
  kQuestion = 'Q',  // with a location
  kCovered = 'C',   // with a location: only whether questions of it are answered
  kCheck = 'K',     // with a location, root or the daemon's own user: compare its whole file system
  kReport = 'R',    // the state of each file system, as the payload of the status frame (JSON)
  kRebuild = 'B',   // root or the daemon's own user: make all tables anew
};
inline constexpr size_t kHelloBytes = 2;
inline constexpr char kHelloAsksTimes = 1;  // flag: times of change decide what is found

struct IndexAnswer {
  UniqueFd connection;  // ready for the question; none where `state` is not kIndexCurrent
  // kIndexCurrent, or why not: "no index", "not indexed", "building 43 %", "behind", "busy", ...
  std::string state;
};

// As long as a search waits for the daemon before it walks.
inline constexpr int kIndexMilliseconds = 150;

// Asks whether the index answers for the folder open at `location_fd`, and begins a question.
// Listeners that are neither root's nor one's own are not believed ("no index").
IndexAnswer AskIndex(int location_fd, bool asks_times);

// The same for a comparing of the whole file system that the folder is on (table_check_child.h).
IndexAnswer AskToCheck(int location_fd);

// Whether the index covers the folder and is current; no question is begun.
bool IsIndexed(int location_fd);

// What the daemon says to a hello without a location; fails with ENOENT or ECONNREFUSED where
// there is no daemon, EAGAIN where it says nothing in that time.
inline constexpr int kReportMilliseconds = 5000;
Result<std::string> AskDaemon(HelloKind kind, int timeout_ms = kReportMilliseconds);

}  // namespace nas
