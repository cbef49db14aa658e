#pragma once
// The process that `arbory index` is: it listens, keeps a watcher for each file system, and hands
// connections on to them. It has one thread, looks at no file name and parses nothing that a user
// sent but the two bytes of a hello; it waits for no file system and no client.
//
// Who connects may send nothing, or too much, or go: connections that have not said their hello are
// few (kMostWaiting), the oldest goes first, and none is kept longer than kHelloMilliseconds.
//
// Watchers that end are started again, after pauses that grow. What is mounted is looked at when it
// changes and every few minutes; a file system that is gone takes its watcher with it, so that
// nothing keeps it in use.

#include <string>

#include "nas/base/error.h"
#include "nas/index/question_child.h"

namespace nas {

// Listens and serves until SIGTERM or SIGINT; SIGHUP looks at once for what is to be indexed.
// `on_ready` is called when it listens. For a process with one thread. Fails where another daemon
// has the same state or socket (EADDRINUSE), or neither can be had.
Status RunIndexDaemon(const AnswerFunction& answer, const std::function<void()>& on_ready);

}  // namespace nas
