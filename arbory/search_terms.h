#pragma once
// What a command line asks of a search and its parameters cannot say, as terms of the query
// language (docs/query.md).

#include <string>

#include "arbory/options.h"

namespace arbory {

// The query's pattern behind the terms that its other options stand for. Values are passed on as
// they are: whoever parses the whole says what is wrong with one, and names it.
std::string PatternWithTerms(const SearchQuery& query);
// The one type asked for, where the API has a parameter that says the same; empty otherwise.
std::string TypeParameter(const SearchQuery& query);

}  // namespace arbory
