#pragma once
// Names that nobody guesses: ids of tasks, results and sessions, and temporary files.

#include <string>
#include <string_view>

namespace nas {

// 32 lower-case hexadecimal digits, of 128 random bits. Throws std::runtime_error where the system
// has no randomness to give.
std::string RandomName();

// Whether `name` is of that form. What a client sends as an id is asked this before it becomes part
// of a path.
bool IsRandomName(std::string_view name);

}  // namespace nas
