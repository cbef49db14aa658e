#include "nas/match/query.h"

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>

#include "nas/match/query_match.h"
#include "nas/match/query_pieces.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

// Builds the tree of pieces, group within group.
class Builder {
 public:
  Builder(std::time_t now, Letters letters) : now_(now), letters_(letters) {
    groups_.emplace_back();
  }

  Status Add(const QueryPiece& piece) {
    switch (piece.kind) {
      case QueryPiece::Kind::kBar:
        groups_.back().joined = true;
        return {};
      case QueryPiece::Kind::kOpen:
        groups_.emplace_back().negated = piece.negated;
        groups_.back().opened = piece.written;
        return {};
      case QueryPiece::Kind::kClose: {
        const bool negated = groups_.back().negated;
        const char* const opened = groups_.back().opened.data();
        QueryNode all = Finish();
        groups_.pop_back();
        const char* const end = piece.written.data() + piece.written.size();
        const std::string_view written(opened, static_cast<size_t>(end - opened));
        if (!all.children.empty()) AddEither(std::move(all), negated, written);
        return {};
      }
      case QueryPiece::Kind::kNothing:
        return {};
      case QueryPiece::Kind::kTerm:
        break;
    }
    auto leaf = LeafOf(piece, now_, letters_);
    if (!leaf) {
      return leaf.error().Of("'" + std::string(piece.written) + "': " + leaf.error().path);
    }
    AddEither(std::move(*leaf), piece.negated, piece.written);
    return {};
  }

  // The innermost group that is open.
  QueryNode Finish() {
    QueryNode all;
    for (QueryNode& term : groups_.back().terms) all.children.push_back(Only(std::move(term)));
    return all;
  }

 private:
  struct Group {
    std::vector<QueryNode> terms;
    bool joined = false;  // a bar stands before the next
    bool negated = false;
    std::string_view opened = {};
  };

  // A node of one child says what the child says.
  static QueryNode Only(QueryNode node) {
    const bool list = node.kind == Kind::kAll || node.kind == Kind::kAny;
    if (!list || node.children.size() != 1) return node;
    QueryNode child = std::move(node.children.front());
    if (!node.written.empty()) child.written = std::move(node.written);
    return child;
  }

  void AddEither(QueryNode node, bool negated, std::string_view written) {
    Group& group = groups_.back();
    if (!group.joined || group.terms.empty()) group.terms.push_back({.kind = Kind::kAny});
    group.joined = false;
    std::string& term = group.terms.back().written;
    term.append(term.empty() ? "" : "|").append(written);
    node = Only(std::move(node));
    if (negated) {
      QueryNode other{.kind = Kind::kNot};
      other.children.push_back(std::move(node));
      node = std::move(other);
    }
    group.terms.back().children.push_back(std::move(node));
  }

  const std::time_t now_;
  const Letters letters_;
  std::vector<Group> groups_;
};

// Brings those that one term stands for to the others of the root.
void SpreadTermsOfWalk(QueryNode& root) {
  std::vector<QueryNode> children;
  for (QueryNode& child : root.children) {
    const bool several = child.kind == Kind::kAll && std::ranges::all_of(child.children, IsOfWalk);
    if (!several)
      children.push_back(std::move(child));
    else
      std::ranges::move(child.children, std::back_inserter(children));
  }
  root.children = std::move(children);
}

Status TermsOfWalkAreAlone(QueryNode& root) {
  SpreadTermsOfWalk(root);
  for (const QueryNode& child : root.children) {
    if (IsOfWalk(child) || !AnyLeaf(child, IsOfWalk)) continue;
    return Error{kErrorIllegal, EINVAL,
                 "'" + child.written +
                     "': exclude:, hidden:, ignored:, mounts: and letters: hold for the whole "
                     "search, so they stand by themselves: not behind !, beside | or in a group "
                     "with others"};
  }
  std::erase_if(root.children, [](const QueryNode& child) { return child.kind == Kind::kLetters; });
  return {};
}

Error Illegal(const char* why) { return {kErrorIllegal, EINVAL, why}; }

}  // namespace

Result<Query> Query::Parse(std::string_view text, std::time_t now) {
  if (text.find('\0') != text.npos) return Illegal("a name cannot hold a NUL");
  // Composing a text of nothing but combining marks takes time by the square of its length: three
  // seconds for one of this length.
  if (text.size() > kMostBytes) return Illegal("the pattern is longer than 64 KiB");
  const auto [pieces, deepest] = CutQuery(text, now);
  if (deepest > kDeepestGroup) return Illegal("groups lie too deep in one another");
  Builder builder(now, LettersOf(pieces));
  for (const QueryPiece& piece : pieces) {
    if (const Status added = builder.Add(piece); !added) return added.error();
  }
  Query query;
  query.root_ = builder.Finish();
  if (const Status alone = TermsOfWalkAreAlone(query.root_); !alone) return alone.error();
  return query;
}

}  // namespace nas
