// What can be written next: see query_spans.h.

#include <algorithm>

#include "nas/base/accounts.h"
#include "nas/match/query_says.h"
#include "nas/match/query_spans.h"

namespace nas {
namespace {

using Of = QueryCompletion::Of;
using Value = QueryPrefix::Value;
constexpr size_t kMostAccounts = 50;

class Completion {
 public:
  Completion(std::string_view query, size_t place, std::time_t now)
      : query_(query), place_(place), now_(now) {}

  QueryCompletion Make() {
    found_ = {.begin = place_, .end = place_};
    const std::vector<QueryPiece> pieces = CutQuery(query_, now_).pieces;
    const auto piece = std::ranges::find_if(pieces, [this](const QueryPiece& one) {
      return one.kind != QueryPiece::Kind::kBar && one.kind != QueryPiece::Kind::kClose &&
             Begin(one.written) < place_ && place_ <= End(one.written);
    });
    if (piece == pieces.end() || piece->kind == QueryPiece::Kind::kOpen) {
      OfPrefixes();
    } else if (piece->prefix != nullptr) {
      OfValue(*piece);
    } else if (piece->form == TextTerm::Form::kPlain && !piece->exact) {
      OfWord(*piece);
    }
    if (found_.items.empty() && found_.of != Of::kShare) found_.of = Of::kNothing;
    return std::move(found_);
  }

 private:
  size_t Begin(std::string_view part) const {
    return static_cast<size_t>(part.data() - query_.data());
  }
  size_t End(std::string_view part) const { return Begin(part) + part.size(); }
  std::string_view typed() const { return query_.substr(found_.begin, place_ - found_.begin); }

  // What begins with what has been typed and is more than that.
  bool Fits(std::string_view text) const {
    const std::string begun = AsciiLower(typed());
    return text.size() > begun.size() && AsciiLower(text.substr(0, begun.size())) == begun;
  }

  void OfPrefixes() {
    found_.of = Of::kPrefix;
    for (const QueryPrefix& prefix : QueryPrefixes()) {
      if (!Fits(prefix.name)) continue;
      found_.items.push_back({std::string(prefix.name), std::string(prefix.about)});
    }
  }

  void OfWord(const QueryPiece& piece) {
    found_.begin = Begin(piece.behind_prefixes);
    found_.end = End(piece.behind_prefixes);
    // A group is text until it is closed.
    while (found_.begin < place_ && (query_[found_.begin] == '<' || query_[found_.begin] == '!')) {
      ++found_.begin;
    }
    if (place_ < found_.begin) return;
    if (!typed().starts_with('/')) return OfPrefixes();
    // The name of a share stands behind the first slash.
    ++found_.begin;
    if (place_ < found_.begin || typed().find('/') != std::string_view::npos) return;
    found_.end = std::min(query_.find('/', found_.begin), found_.end);
    found_.of = Of::kShare;
  }

  void OfValue(const QueryPiece& piece) {
    const QueryPrefix& prefix = *piece.prefix;
    found_.begin = Begin(piece.behind_prefixes);
    found_.end = End(piece.behind_prefixes);
    if (place_ < found_.begin) return;
    const size_t comma = typed().rfind(',');
    if (comma != std::string_view::npos) found_.begin += comma + 1;
    found_.end = std::min(query_.find(',', place_), found_.end);
    found_.of = Of::kValue;
    if (prefix.kind == QueryNode::Kind::kOwner || prefix.kind == QueryNode::Kind::kGroup) {
      return OfAccounts(prefix.kind == QueryNode::Kind::kOwner);
    }
    for (size_t at = 0; at < prefix.values.size();) {
      const size_t end = std::min(prefix.values.find(' ', at), prefix.values.size());
      const std::string_view value = prefix.values.substr(at, end - at);
      at = end + 1;
      if (Fits(value)) found_.items.push_back({std::string(value), Said(prefix, value)});
    }
  }

  void OfAccounts(bool users) {
    std::string_view begun = typed();
    if (begun.starts_with('"')) begun.remove_prefix(1);
    const auto names = users ? UsersLike(begun, kMostAccounts) : GroupsLike(begun, kMostAccounts);
    for (const std::string& name : names) {
      const bool plain = name.find_first_of(" ,|<>\"") == std::string::npos;
      if (name.find('"') != std::string::npos || name == begun) continue;
      found_.items.push_back({plain ? name : "\"" + name + "\"", ""});
    }
  }

  // What the term would say.
  std::string Said(const QueryPrefix& prefix, std::string_view value) const {
    const QueryPiece piece{.prefix = &prefix, .value = std::string(value)};
    const auto leaf = LeafOf(piece, now_, Letters::kAny);
    return leaf ? SayLeaf(piece, *leaf) : "";
  }

  const std::string_view query_;
  const size_t place_;
  const std::time_t now_;
  QueryCompletion found_;
};

}  // namespace

QueryCompletion CompletionAt(std::string_view query, size_t place, std::time_t now) {
  if (query.size() > Query::kMostBytes) return {};
  return Completion(query, std::min(place, query.size()), now).Make();
}

}  // namespace nas
