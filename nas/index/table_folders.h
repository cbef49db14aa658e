#pragma once
// Where tables lie: STATE/index/ID/names, ID being the file system's own. That of a file system
// which is not there stays for its return, as a disk that is taken out and put in again has, but
// not for ever.

#include <ctime>
#include <string>

#include "nas/index/index_plan.h"

namespace nas {

inline constexpr char kTableName[] = "names";
// Of a table while it is written, behind its name.
inline constexpr char kUnfinished[] = ".new";

// STATE/index, and the folder below it that is a file system's own.
std::string TablesFolder();
std::string TableFolder(const FileSystem& file_system);

// Removes the tables of file systems that no plan has had for 30 days before `now`, and folders
// without a table of those that this plan does not have. What else lies there stays. What the plan
// has is noted by its folder's time, once a day, so that a disk may sleep.
void SweepTableFolders(const Plan& plan, std::time_t now);

}  // namespace nas
