#pragma once
// What the fuzz targets share. A target is one file: it takes an input, gives it to the code as a
// client or a damaged disk would, and demands what that code promises, beyond not crashing.
// scripts/fuzz runs a target with inputs that libFuzzer finds, replay.cpp with the seeds.

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace fuzz {

// What a target returns: for an input that was used, and for one that is not worth keeping.
inline constexpr int kUsed = 0;
inline constexpr int kUseless = -1;

// Defined by each target. What it opens for one input it closes again, which fuzz.cpp demands.
int Target(std::string_view input);

// Takes off `rest` what stands before the first `separator`, which is dropped; all of it where
// there is none.
std::string_view Take(std::string_view* rest, char separator);

// Ends the process as a crash where a promise was broken.
void Demand(bool kept, const char* promise, const char* file, int line);

// A folder of this process's own, removed at its end.
const std::string& Scratch();
void WriteFile(const std::string& path, std::string_view bytes);

}  // namespace fuzz

#define DEMAND(condition) fuzz::Demand((condition), #condition, __FILE__, __LINE__)
