#pragma once
// The process that answers one question, forked from the watcher right after its barrier, so that
// what it has in memory, the table's mapping and the changes, is a snapshot of that moment.
//
// What may go wrong in it: it acts for somebody who chose the question and who may own what it
// reads. So, before it reads a byte of the question, it
//
//   - keeps the connection and the location open and nothing else;
//   - becomes the peer for good, as the kernel told of the connection: groups, all three ids, no
//     capabilities but, for root, those that read; no way back, not to be traced, no new rights;
//   - is bounded in memory, processor time and how long it waits for the peer, and among the first
//     to go where memory runs out.
//
// A peer of root's is answered with root's rights to read, whatever it gave up of its own. What a
// peer has beyond its ids and groups (capabilities of its own) is not taken over.

#include <sys/types.h>

#include <functional>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"
#include "nas/index/changes.h"
#include "nas/index/daemon_socket.h"

namespace nas {

// Reads the question and answers it, as index_answer.h of nas/search has it.
using AnswerFunction =
    std::function<void(int connection, UniqueFd location, const IndexSnapshot& snapshot)>;

struct Question {
  int connection = -1;  // borrowed, like the location
  int location = -1;
  Peer peer;
  bool asks_times = false;
};

// Makes the process the peer's, for good. EPERM where it cannot become that user.
Status BecomePeer(const Peer& peer);

// Forks the child, which says kIndexCurrent to the peer and then calls `answer`. Its id, for the
// caller to reap, or -1 with errno set. With asks_times, files that processes have mapped for
// writing are added to the child's `changes`. For a process of one thread.
pid_t StartQuestion(const Question& question, const NameTable& table, Changes& changes,
                    bool attributes_current, const AnswerFunction& answer);

}  // namespace nas
