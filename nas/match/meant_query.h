#pragma once
// What people write by the habits of other search programs, in this language. Only for a query that
// found nothing: each of these is a name first.

#include <string>
#include <string_view>

namespace nas {

// `query` with what was most likely meant: "size > 1gb" is size:>1gb, "date:2019" modified:2019,
// "*.png;*.jpg" *.png|*.jpg, "a OR b" a|b, "-a" !a, "dir\file" dir/file. Empty where it says
// nothing else. What stands in quotes or behind "regex:" stays.
std::string MeantQuery(std::string_view query);

}  // namespace nas
