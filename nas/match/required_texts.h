#pragma once
// What every name that a query can match must hold, so that most of very many names are told from
// one look for texts over all of them.

#include <string>
#include <vector>

#include "nas/match/query.h"

namespace nas {

// So many texts are looked for at most; beyond it asking every name is as quick.
inline constexpr size_t kMostRequiredTexts = 16;

// Texts, one of which is in the folded form of the name of every match, or in that form without
// accents; none where that cannot be told. Speaks of names alone: where contents stand in for them
// (content_query.h) it does not hold.
std::vector<std::string> RequiredTexts(const QueryNode& query);

}  // namespace nas
