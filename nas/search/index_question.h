#pragma once
// The question that an index is asked about one location: JSON in one frame (nas/index/frames.h).
//
//   "query"      the criteria (nas/match/query_json.h)
//   "texts_too"  whether contents can stand in for names; then what names do not decide comes back
//                as files to be read
//   "recursive"
//   "share"      name, root, and the path below it: how rows and terms about paths see the
//   location,
//                which itself is not named but handed over open
//   "mounts"     paths below it where something is mounted, for the asker to search
//   "temporary", "locations"
//                device and inode of folders that are not entered (folder_gate.h), one after the
//                other
//   "unread"     whether folders that cannot be read are to be named
//   "names"      whether rows need tell no more than names and types
//   "best"       of an instant question: so many rows, the best first
//
// The answer is frames: blocks of rows (kRows: 32-bit lengths of folders and names, then the three
// sides of a RowBlock whose location is 0), files to be read (kCandidates: path below the share's
// root and names, each NUL-ended), counts so far (kProgress: WalkProgress::Counts), and kEnd, for
// an instant question with a BestCount (index_best.h). Or kStatus with a few words why there is
// none. Without kEnd the answer is not whole.

#include <string>
#include <string_view>
#include <vector>

#include "nas/match/query.h"
#include "nas/search/folder_gate.h"

namespace nas {

struct IndexQuestion {
  QueryNode query;
  bool texts_too = false;
  bool unread = false;
  bool names_alone = false;
  Share share;       // no volume
  std::string path;  // below the share's root
  std::vector<std::string> mounts;
  FolderGate::Rules rules;
  size_t best = 0;  // 0: everything, in any order
};

// As many rows as an instant question may ask for.
inline constexpr size_t kMostBest = 1000;

// What the daemon is told before the question: files that are written to by memory alone have to be
// looked for, since that changes their time of change without an event. Nothing else of them
// changes so: neither size nor time of creation.
bool AsksTimes(const QueryNode& query);

std::string QuestionText(const IndexQuestion& question);
// Fails with kErrorIllegal.
Result<IndexQuestion> ReadQuestion(std::string_view text);

}  // namespace nas
