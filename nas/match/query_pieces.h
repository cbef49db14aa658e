#pragma once
// A query cut into pieces: quotes, bars, groups and where a value ends, nothing of meaning. The
// tree (query.h) and what a person is told of each term (query_spans.h) are made of the same
// pieces.

#include <ctime>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/query_prefix.h"
#include "nas/match/text_term.h"

namespace nas {

struct QueryPiece {
  enum class Kind {
    kTerm,
    kNothing,  // a text or expression of no characters, which asks for nothing
    kBar,
    kOpen,
    kClose,
  };
  Kind kind = Kind::kTerm;
  bool negated = false;
  const QueryPrefix* prefix = nullptr;  // of a value, or kContent's
  TextTerm::Form form = TextTerm::Form::kPlain;
  bool exact = false;
  bool open = false;  // whatever were written behind it would be part of it
  std::string value = {};
  // Parts of the query: the whole piece, with its "!"; and of a term what stands behind "!" and
  // prefixes, as it is written.
  std::string_view written = {};
  std::string_view behind_prefixes = {};
};

struct QueryPieces {
  std::vector<QueryPiece> pieces;
  size_t deepest = 0;  // of the groups in one another
};

// Every text can be cut; where not every group is closed there are none. `now` tells which words go
// on with a time. Pieces refer to `text`.
QueryPieces CutQuery(std::string_view text, std::time_t now);

// How texts are compared, by the last term that says it.
Letters LettersOf(const std::vector<QueryPiece>& pieces);

// What a kTerm asks for by itself, without its "!". Fails as PrefixNode does.
Result<QueryNode> LeafOf(const QueryPiece& piece, std::time_t now, Letters letters);

}  // namespace nas
