#include "nas/match/query_spans.h"

#include <algorithm>
#include <utility>

#include "nas/match/query_match.h"
#include "nas/match/query_says.h"
#include "nas/match/wildcards.h"

namespace nas {
namespace {

using Kind = QuerySpan::Kind;
using Form = TextTerm::Form;
using Value = QueryPrefix::Value;

size_t PlaceOf(std::string_view part, std::string_view query) {
  return static_cast<size_t>(part.data() - query.data());
}

// Of lists: what stands between the commas.
std::vector<std::string> ValuesOf(const QueryPiece& piece) {
  std::vector<std::string> values;
  const bool globs = piece.prefix->value == Value::kGlobs;
  const std::string_view all = piece.value;
  for (size_t at = 0; at < all.size();) {
    const size_t end = globs ? EndOfGlob(all, at) : std::min(all.find(',', at), all.size());
    if (end > at) values.emplace_back(all.substr(at, end - at));
    at = end + 1;
  }
  return values;
}

// Of a path only its last name is seen.
std::string_view LastName(std::string_view path) { return path.substr(path.rfind('/') + 1); }

std::vector<QueryWord> WordsOf(const QueryNode& leaf) {
  using As = QueryWord::As;
  const bool of_content = leaf.kind == QueryNode::Kind::kContent;
  if (!of_content && leaf.kind != QueryNode::Kind::kText) return {};
  const TextTerm& term = *leaf.text;
  const bool exact = term.exact();
  const bool plain = !term.of_path() && !term.has_wildcards();
  if (of_content || plain || term.is_regex()) {
    const As as = term.is_regex() ? As::kRegex : As::kLiteral;
    return {{.text = term.text(), .as = as, .exact = exact, .in_name = !of_content}};
  }
  std::vector<QueryWord> words;
  const auto add = [&](std::string_view text, As as, bool in_name) {
    if (text.empty()) return;
    words.push_back({std::string(text), as, exact, in_name, !in_name});
  };
  if (!term.has_wildcards()) {
    add(LastName(term.text()), As::kStart, true);
  } else {
    for (const std::string& glob : Wildcards::Alternatives(term.given())) {
      add(LastName(glob), As::kGlob, true);
    }
  }
  if (term.is_literal()) add(term.text(), As::kLiteral, false);
  return words;
}

Kind KindOf(const QueryPiece& piece) {
  if (piece.prefix != nullptr || piece.exact) return Kind::kPrefix;
  if (piece.form == Form::kRegex) return Kind::kRegex;
  return piece.behind_prefixes.starts_with('"') ? Kind::kPhrase : Kind::kText;
}

std::string PrefixOf(const QueryPiece& piece) {
  const QueryPrefix* prefix = piece.prefix;
  if (prefix == nullptr && piece.exact) prefix = FindPrefix("case:");
  if (prefix == nullptr && piece.form == Form::kRegex) prefix = FindPrefix("regex:");
  return prefix == nullptr ? "" : std::string(prefix->name.substr(0, prefix->name.size() - 1));
}

class Spans {
 public:
  Spans(std::string_view query, std::time_t now)
      : query_(query), now_(now), cut_(CutQuery(query, now)), letters_(LettersOf(cut_.pieces)) {}

  std::vector<QuerySpan> All() {
    for (size_t i = 0; i < cut_.pieces.size() && spans_.size() < kMostSpans; ++i) Add(i);
    TellOfTheWhole();
    return std::move(spans_);
  }

 private:
  void Add(size_t number) {
    const QueryPiece& piece = cut_.pieces[number];
    using Piece = QueryPiece::Kind;
    if (piece.kind == Piece::kOpen) groups_.push_back(left_out() || piece.negated);
    if (piece.kind == Piece::kClose) groups_.pop_back();
    const size_t begin = PlaceOf(piece.written, query_);
    const size_t end = begin + piece.written.size();
    if (piece.kind == Piece::kBar) {
      Sign(Kind::kOperator, begin, end, "either side is enough");
      return;
    }
    if (piece.negated) Sign(Kind::kOperator, begin, begin + 1, "leaves out what follows");
    const size_t behind = begin + (piece.negated ? 1 : 0);
    if (piece.kind == Piece::kOpen || piece.kind == Piece::kClose) {
      Sign(Kind::kGroup, behind, end, "a group, which stands as one term");
      return;
    }
    const auto is_bar = [&](size_t at) {
      return at < cut_.pieces.size() && cut_.pieces[at].kind == Piece::kBar;
    };
    QuerySpan& span = spans_.emplace_back();
    span = {.kind = KindOf(piece), .begin = behind, .end = end};
    span.value = PlaceOf(piece.behind_prefixes, query_);
    span.alone = groups_.empty() && !piece.negated && !is_bar(number + 1) && !is_bar(number - 1);
    span.open = piece.open;
    span.prefix = PrefixOf(piece);
    if (piece.prefix != nullptr && piece.prefix->value != Value::kText)
      span.values = ValuesOf(piece);
    if (piece.kind == Piece::kTerm) Understand(piece, span);
  }

  bool left_out() const { return !groups_.empty() && groups_.back(); }

  void Sign(Kind kind, size_t begin, size_t end, const char* says) {
    spans_.push_back({.kind = kind, .begin = begin, .value = begin, .end = end, .says = says});
  }

  void Understand(const QueryPiece& piece, QuerySpan& span) {
    const auto leaf = LeafOf(piece, now_, letters_);
    if (!leaf) {
      span.wrong = leaf.error().path;
      some_wrong_ = true;
      return;
    }
    span.says = (piece.negated ? "not: " : "") + SayLeaf(piece, *leaf);
    if (!piece.negated && !left_out()) span.words = WordsOf(*leaf);
    if (AnyLeaf(*leaf, IsOfWalk) && !span.alone) of_walk_.push_back(spans_.size() - 1);
  }

  // What is refused though each term by itself is understood: terms about the whole search that do
  // not stand by themselves.
  void TellOfTheWhole() {
    if (some_wrong_ || of_walk_.empty()) return;
    const auto parsed = Query::Parse(query_, now_);
    if (parsed) return;
    for (const size_t number : of_walk_) spans_[number].wrong = parsed.error().path;
  }

  const std::string_view query_;
  const std::time_t now_;
  const QueryPieces cut_;
  const Letters letters_;
  std::vector<bool> groups_;  // those that are open: whether what they find is left out
  bool some_wrong_ = false;
  std::vector<size_t> of_walk_;
  std::vector<QuerySpan> spans_;
};

// A query that Query::Parse refuses as a whole.
bool IsTooMuch(std::string_view query) {
  return query.size() > Query::kMostBytes || query.find('\0') != query.npos;
}

}  // namespace

std::vector<QuerySpan> SpansOf(std::string_view query, std::time_t now) {
  if (IsTooMuch(query)) return {};
  return Spans(query, now).All();
}

}  // namespace nas
