#pragma once
// A term of a query in a few words for people: what it was understood to ask for.

#include <string>

#include "nas/match/query_pieces.h"

namespace nas {

// Of the piece's leaf (LeafOf). Begins with a small letter and ends without a full stop.
std::string SayLeaf(const QueryPiece& piece, const QueryNode& leaf);

}  // namespace nas
