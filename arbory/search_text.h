#pragma once
// What the terminal says of a search: how far it has come, and why it could not be run.

#include <cstdint>
#include <string>
#include <vector>

#include "arbory/caller.h"
#include "arbory/running_search.h"

namespace arbory {

// "1 folder", "1,204 folders".
std::string Counted(std::uint64_t number, const char* one, const char* many);
// "Searching 3 s: 1,204 folders, 23,456 entries, 42 found"; of contents "Reading 9 s: 12 of 345
// files, 1.2 GB, 3 found, photo/film.mkv".
std::string ProgressText(const RunningSearch& search, long seconds);

// How a search was answered, in a few words: "from the index, current".
std::string SourceText(const RunningSearch& search);

// Why a search of `folders` failed with the web API code `code`.
std::string FailureSentence(int code, const std::vector<std::string>& folders);
// Why no search can be started for the caller's user just now; empty when one can.
std::string WhyNoSearch(const Caller& caller);

}  // namespace arbory
