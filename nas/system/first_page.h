#pragma once
// The page that whoever begins a search in this process will ask for first. That is not a parameter
// of a search, whose results can be listed in any order; a search whose rows come from afar has
// them come in a better one.

#include <string>

namespace nas {

struct FirstPage {
  std::string sort_by;  // as a listing names it; empty: none is known
  bool descending = false;
  unsigned rows = 0;
};

// For the rest of the process and what it forks. For one thread.
void ExpectFirstPage(FirstPage page);
const FirstPage& ExpectedFirstPage();

}  // namespace nas
