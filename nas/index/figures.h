#pragma once
// What a watcher tells of itself, in memory that it shares with the broker: read at any moment,
// while the watcher works or is dead, and never waited for. One writer; each number stands alone.

#include <atomic>
#include <cstdint>
#include <string>

#include "nas/index/tree_scan.h"

namespace nas {

enum class IndexState : std::uint32_t {
  kStarting,     // nothing is known yet
  kBuilding,     // there is no table to answer from
  kNames,        // answers; of attributes only what searches look up
  kCurrent,      // answers
  kBehind,       // there is a table, but events were lost: it is being compared
  kUnavailable,  // cannot be indexed; `error` says why
};

struct Figures {
  std::atomic<IndexState> state = IndexState::kStarting;
  std::atomic<int> error = 0;               // errno
  std::atomic<bool> by_folder = false;      // events of single folders: attributes are looked up
  std::atomic<std::uint64_t> expected = 0;  // entries, while building; 0: not known
  ScanProgress progress;                    // of these
  std::atomic<std::uint64_t> entries = 0;
  std::atomic<std::uint64_t> folders = 0;
  std::atomic<std::uint64_t> table_bytes = 0;
  std::atomic<std::uint64_t> changes = 0;    // noted since the table was made
  std::atomic<std::uint64_t> events = 0;     // since the watcher was started
  std::atomic<std::uint64_t> watches = 0;    // on single folders
  std::atomic<std::uint64_t> questions = 0;  // answered or being answered
  std::atomic<std::uint64_t> refused = 0;    // of those who were told to walk
  std::atomic<std::int64_t> made_at = 0;     // when the table in use was made; seconds since 1970
  std::atomic<std::int64_t> swept_at = 0;    // when it was last compared with the file system
  std::atomic<std::uint64_t> work_ms = 0;    // what the last making or comparing took
  // On the steady clock, when this watcher first answered; 0 before.
  std::atomic<std::int64_t> answers_since_ns = 0;
};

inline bool Answers(IndexState state) {
  return state == IndexState::kNames || state == IndexState::kCurrent;
}

// In the words that askers get, "building 43 %" among them; what answers is kIndexCurrent.
std::string StateWords(const Figures& figures);

}  // namespace nas
