#pragma once
// What can be told of an expression without running it.

#include <string>
#include <string_view>

namespace nas {

// The longest text in ASCII, in lower case, that is in every text which the expression (regex.h)
// matches, whatever the case of its letters there; empty where none can be told. Careful rather
// than clever: alternatives, groups and options tell nothing. `exact`: letter case counts.
std::string LiteralOf(std::string_view expression, bool exact);

}  // namespace nas
