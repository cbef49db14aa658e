#pragma once
// What a search's task record holds. It is the one thing that the processes of a search share: the
// request that starts it, its worker with the walker in it, the later requests that list, stop and
// clean it, and whoever follows it from outside.
//
//   "progress"      0 running, 1 finished, -1 failed
//   "data"          "taskid", "pid" (of the worker), "location": start, before the worker's first
//                   access
//                   "sdbid", "sdbvol" (the result database), "owner", "group", "pattern",
//                   "extension" (as the user typed them): worker, before the walk
//                   "errno" (web API code): worker, at the end, of a failed search only
//   "result_ready"  true once the first page can be asked for: walker
//   "walk"          what the walk has seen so far: walker, a few times a second
//                   "phase" ("names", then perhaps "contents", then "done": no more rows will
//                   come), "folders", "entries", "matches",
//                   "skipped" {"permission", "vanished", "other"}: folders that could not be read;
//                   files that vanished are among those
//                   "files" {"unreadable", "not_text"}: files left out
//                   "reading" {"files", "of", "bytes", "path"}: in "contents", how many files have
//                   been read, of how many, and which of them was begun last
//                   "unread" [{"path", "errno"}]: the first folders that could not be read, where
//                   somebody asked for them
//                   "source" where names came from: "index", "walk", or "both" for parts of each
//                   "index" why so: "current", or a few words about why there was no answer
//                   "fleet" of a search that asks other machines: "total", and of those how many
//                   have "answered" to the end, are "late", "down", "refused" or "old" so far
//                   (nas/fleet/asker.h); "boxes": "name", "state", "why" of those four kinds
//
// After the first write only the worker writes, and always the whole of "data": it reads the object
// back, adds to it and writes it. A stopped worker marks the task finished and writes nothing, so
// its "progress" stays 0. Readers may see any stage and wait for the member that they need. The
// record lies in a folder of the user's own, so a reader of another identity believes nothing in it
// and takes the user's before it looks at what the record names.

namespace task_record {

inline constexpr char kProgress[] = "progress";
inline constexpr int kRunning = 0;
inline constexpr int kSucceeded = 1;
inline constexpr int kFailed = -1;

inline constexpr char kData[] = "data";
inline constexpr char kTaskId[] = "taskid";
inline constexpr char kPid[] = "pid";
inline constexpr char kLocation[] = "location";
inline constexpr char kDatabaseId[] = "sdbid";
inline constexpr char kDatabaseVolume[] = "sdbvol";
inline constexpr char kErrno[] = "errno";

inline constexpr char kResultReady[] = "result_ready";

inline constexpr char kWalk[] = "walk";
inline constexpr char kPhase[] = "phase";
inline constexpr char kNamesPhase[] = "names";
inline constexpr char kContentsPhase[] = "contents";
inline constexpr char kDonePhase[] = "done";
inline constexpr char kFolders[] = "folders";
inline constexpr char kEntries[] = "entries";
inline constexpr char kMatches[] = "matches";
inline constexpr char kSkipped[] = "skipped";
inline constexpr char kPermission[] = "permission";
inline constexpr char kVanished[] = "vanished";
inline constexpr char kOther[] = "other";
inline constexpr char kFiles[] = "files";
inline constexpr char kUnreadable[] = "unreadable";
inline constexpr char kNotText[] = "not_text";
inline constexpr char kReading[] = "reading";
inline constexpr char kOf[] = "of";
inline constexpr char kBytes[] = "bytes";
inline constexpr char kPath[] = "path";
inline constexpr char kUnread[] = "unread";
inline constexpr char kUnreadErrno[] = "errno";
inline constexpr char kSource[] = "source";
inline constexpr char kFromIndex[] = "index";
inline constexpr char kFromWalk[] = "walk";
inline constexpr char kFromBoth[] = "both";
inline constexpr char kIndex[] = "index";
inline constexpr char kFleet[] = "fleet";

}  // namespace task_record
