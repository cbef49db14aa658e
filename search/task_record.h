#pragma once
// What a search's task record holds. It is the one thing that the processes of a search share: the
// request that starts it, its worker, and the later requests that list, stop and clean it.
//
//   "progress"  0 running, 1 finished, -1 failed
//   "data"      "taskid", "pid" (of the worker), "location": start, before the worker's first
//   access
//               "sdbid", "sdbvol" (the result database), "owner", "group", "pattern", "extension"
//               (as the user typed them): worker, before the walk
//               "errno" (web API code): worker, at the end, of a failed search only
//
// After the first write only the worker writes, and always the whole of "data": it reads the object
// back, adds to it and writes it. A stopped worker marks the task finished and writes nothing, so
// its "progress" stays 0. Readers may see any stage and wait for the member that they need.

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

// Set by the walker once the first page can be asked for.
inline constexpr char kResultReady[] = "result_ready";

// Bounds of the waits, in the task manager's tenths of a second.
inline constexpr int kFirstWriteBound = 60;  // the parent writes right after the fork
inline constexpr int kCleanBound = 60;       // a search that never got so far is cleaned as it is
inline constexpr int kDatabaseBound = 500;   // opening the locations of a busy machine takes time
inline constexpr int kResultReadyBound = 100;

}  // namespace task_record
