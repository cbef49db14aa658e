#include "nas/match/query.h"

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <optional>
#include <utility>

#include "nas/match/query_match.h"
#include "nas/match/query_prefix.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;
using Form = TextTerm::Form;
constexpr size_t kNone = std::string_view::npos;

// A query cut into pieces. Knows quotes, bars, groups and where a value ends, nothing of meaning.
struct Piece {
  enum class Kind { kTerm, kBar, kOpen, kClose };
  Kind kind = Kind::kTerm;
  bool negated = false;
  const QueryPrefix* prefix = nullptr;  // of a value, or kContent's
  Form form = Form::kPlain;
  bool exact = false;
  std::string value = {};
  std::string_view written = {};  // the whole term; of a sign that opens or closes, that sign
};

class Scanner {
 public:
  Scanner(std::string_view text, bool groups, std::time_t now)
      : text_(text), groups_(groups), now_(now) {}

  std::vector<Piece> Scan() {
    while (at_ < text_.size()) {
      if (text_[at_] == ' ') {
        ++at_;
      } else if (text_[at_] == '|') {
        pieces_.push_back({.kind = Piece::Kind::kBar});
        ++at_;
      } else {
        ScanEither();
      }
    }
    return std::move(pieces_);
  }
  bool balanced() const { return open_ == 0; }
  size_t deepest() const { return deepest_; }

 private:
  void ScanEither();
  void ScanTerm(Piece piece);
  bool TakePrefix(Piece& piece);
  void TakeRegex(Piece& piece);
  void TakeQuoted(Piece& piece);
  void TakeValue(Piece& piece);
  void TakeGlobs(Piece& piece);
  std::string_view TakeWord();
  void TakeMoreWords(Piece& piece, size_t from);
  bool EndsAt(size_t at) const {
    return at >= text_.size() || text_[at] == ' ' || text_[at] == '|' ||
           (open_ > 0 && text_[at] == '>');
  }

  const std::string_view text_;
  const bool groups_;
  const std::time_t now_;
  size_t at_ = 0;
  size_t open_ = 0;
  size_t deepest_ = 0;
  size_t closing_ = 0;  // groups that end behind the term
  std::vector<Piece> pieces_;
};

void Scanner::ScanEither() {
  Piece piece;
  const size_t from = at_;
  const auto next = [this] { return at_ + 1 < text_.size() ? text_[at_ + 1] : ' '; };
  if (text_[at_] == '!' && next() != ' ' && next() != '|') {
    piece.negated = true;
    ++at_;
  }
  if (groups_ && text_[at_] == '<' && at_ + 1 < text_.size() && text_[at_ + 1] != '>') {
    piece.kind = Piece::Kind::kOpen;
    ++at_;
    piece.written = text_.substr(from, at_ - from);
    deepest_ = std::max(deepest_, ++open_);
    pieces_.push_back(std::move(piece));
    return;
  }
  closing_ = 0;
  ScanTerm(std::move(piece));
  Piece& term = pieces_.back();
  term.written = text_.substr(from, at_ - closing_ - from);
  if (term.value.empty() && term.prefix == nullptr) pieces_.pop_back();
  open_ -= closing_;
  for (; closing_ > 0; --closing_) {
    pieces_.push_back({.kind = Piece::Kind::kClose, .written = text_.substr(at_ - closing_, 1)});
  }
}

void Scanner::ScanTerm(Piece piece) {
  while (TakePrefix(piece)) {
  }
  const bool is_text = piece.prefix == nullptr || piece.prefix->value == QueryPrefix::Value::kText;
  if (piece.form == Form::kRegex) {
    TakeRegex(piece);
  } else if (!is_text) {
    TakeValue(piece);
  } else if (at_ < text_.size() && text_[at_] == '"') {
    TakeQuoted(piece);
  } else {
    piece.value = TakeWord();
  }
  pieces_.push_back(std::move(piece));
}

// "content:" and "case:" may stand before "regex:"; everything else stands alone.
bool Scanner::TakePrefix(Piece& piece) {
  const QueryPrefix* prefix = FindPrefix(text_.substr(at_));
  if (prefix == nullptr || piece.form == Form::kRegex) return false;
  const bool first = piece.prefix == nullptr && !piece.exact;
  const bool regex = prefix->value == QueryPrefix::Value::kRegex;
  if (!first && !regex) return false;
  at_ += prefix->name.size();
  if (regex) {
    piece.form = Form::kRegex;
  } else if (prefix->value == QueryPrefix::Value::kExact) {
    piece.exact = true;
  } else {
    piece.prefix = prefix;
  }
  if (piece.exact && piece.prefix == nullptr && EndsAt(at_)) piece.prefix = prefix;
  return prefix->value == QueryPrefix::Value::kText || piece.exact;
}

// In quotes, up to one that a term can end behind; else the rest, or in a group one word.
void Scanner::TakeRegex(Piece& piece) {
  if (at_ < text_.size() && text_[at_] == '"') {
    size_t end = text_.find('"', at_ + 1);
    while (end != kNone && !EndsAt(end + 1)) end = text_.find('"', end + 1);
    if (end != kNone) {
      piece.value = text_.substr(at_ + 1, end - at_ - 1);
      at_ = end + 1;
      return;
    }
  }
  if (open_ > 0) {
    piece.value = TakeWord();
    return;
  }
  std::string_view rest = text_.substr(at_);
  while (rest.ends_with(' ')) rest.remove_suffix(1);
  // A space behind a backslash is one that is meant.
  const size_t backslashes = rest.size() - (rest.find_last_not_of('\\') + 1);
  if (backslashes % 2 == 1 && at_ + rest.size() < text_.size()) {
    rest = text_.substr(at_, rest.size() + 1);
  }
  piece.value = rest;
  at_ = text_.size();
}

void Scanner::TakeQuoted(Piece& piece) {
  if (piece.form == Form::kPlain) piece.form = Form::kLiteral;
  const std::string_view rest = text_.substr(at_);
  piece.value = rest.substr(1, rest.find('"', 1) - 1);
  at_ += std::min(rest.size(), piece.value.size() + 2);
}

// Up to a space or bar; ">" at its end close the groups that are open.
std::string_view Scanner::TakeWord() {
  std::string_view word = text_.substr(at_);
  word = word.substr(0, word.find_first_of(" |"));
  at_ += word.size();
  while (closing_ < open_ && word.ends_with('>')) {
    word.remove_suffix(1);
    ++closing_;
  }
  return word;
}

// A value that is no text: what quotes hold is part of it. In one of globs a quote that is meant
// stands behind a backslash.
void Scanner::TakeValue(Piece& piece) {
  if (piece.prefix->value == QueryPrefix::Value::kGlobs) return TakeGlobs(piece);
  const size_t from = at_;
  bool has_quotes = false;
  while (!closing_ && at_ < text_.size() && text_[at_] != ' ' && text_[at_] != '|') {
    if (text_[at_] == '"') {
      const size_t end = std::min(text_.find('"', at_ + 1), text_.size());
      piece.value.append(text_.substr(at_ + 1, end - at_ - 1));
      at_ = std::min(end + 1, text_.size());
      has_quotes = true;
      continue;
    }
    const size_t end = std::min(text_.find_first_of(" |\"", at_), text_.size());
    if (end < text_.size() && text_[end] == '"') {
      piece.value.append(text_.substr(at_, end - at_));
      at_ = end;
    } else {
      piece.value.append(TakeWord());
    }
  }
  if (!has_quotes && !closing_) TakeMoreWords(piece, from);
}

void Scanner::TakeGlobs(Piece& piece) {
  bool quoted = false;
  for (; at_ < text_.size() && (quoted || (text_[at_] != ' ' && text_[at_] != '|')); ++at_) {
    const bool escape = text_.substr(at_).starts_with("\\\"");
    if (text_[at_] == '"') {
      quoted = !quoted;
    } else {
      piece.value.push_back(text_[at_ += escape ? 1 : 0]);
    }
  }
  while (!quoted && closing_ < open_ && piece.value.ends_with('>')) {
    piece.value.pop_back();
    ++closing_;
  }
}

// "2 weeks ago" and "10 MB": words that go on with a value which is none without them, or which
// only have a meaning behind it.
void Scanner::TakeMoreWords(Piece& piece, size_t from) {
  using Value = QueryPrefix::Value;
  constexpr int kMostWords = 6;
  const Value value = piece.prefix->value;
  if (value != Value::kTime && value != Value::kSize) return;
  const bool whole = IsValueOf(*piece.prefix, piece.value, now_);
  size_t end = at_;
  for (int i = 0; i < kMostWords && end < text_.size() && text_[end] == ' '; ++i) {
    const size_t word = end + 1;
    end = std::min(text_.find_first_of(" |", word), text_.size());
    size_t closing = 0;
    while (closing < open_ && end - closing > word && text_[end - closing - 1] == '>') ++closing;
    const std::string_view last = text_.substr(word, end - closing - word);
    const std::string_view all = text_.substr(from, end - closing - from);
    const bool unit = last.size() > 1 && ReadSize("1" + std::string(last)).has_value();
    const bool joins = value == Value::kSize ? unit : !whole || AsciiLower(last) == "ago";
    if (!joins || (whole && i > 0)) break;
    if (!IsValueOf(*piece.prefix, all, now_)) continue;
    piece.value = all;
    at_ = end;
    closing_ = closing;
  }
}

// Builds the tree of pieces, group within group.
class Builder {
 public:
  Builder(std::time_t now, Letters letters) : now_(now), letters_(letters) {
    groups_.emplace_back();
  }

  Status Add(Piece& piece) {
    switch (piece.kind) {
      case Piece::Kind::kBar:
        groups_.back().joined = true;
        return {};
      case Piece::Kind::kOpen:
        groups_.emplace_back().negated = piece.negated;
        groups_.back().opened = piece.written;
        return {};
      case Piece::Kind::kClose: {
        const bool negated = groups_.back().negated;
        const char* const opened = groups_.back().opened.data();
        QueryNode all = Finish();
        groups_.pop_back();
        const char* const end = piece.written.data() + piece.written.size();
        const std::string_view written(opened, static_cast<size_t>(end - opened));
        if (!all.children.empty()) AddEither(std::move(all), negated, written);
        return {};
      }
      case Piece::Kind::kTerm:
        break;
    }
    auto leaf = Leaf(piece);
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

  Result<QueryNode> Leaf(const Piece& piece) const {
    const bool content = piece.prefix != nullptr && piece.prefix->kind == Kind::kContent;
    const bool is_text = piece.prefix == nullptr || content;
    if (!is_text && piece.prefix->value != QueryPrefix::Value::kExact) {
      return PrefixNode(*piece.prefix, piece.value, now_, letters_);
    }
    if (piece.value.empty()) {
      return Error{kErrorIllegal, EINVAL, std::string(piece.prefix->help)};
    }
    const Form form = content && piece.form == Form::kPlain ? Form::kLiteral : piece.form;
    const bool exact =
        piece.exact || (!content && IsExact(letters_, piece.value, form == Form::kRegex));
    auto text = TextTerm::Make(piece.value, form, exact);
    if (!text) return text.error();
    QueryNode node{.kind = content ? Kind::kContent : Kind::kText};
    node.text = std::move(*text);
    return node;
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

// The last term wins that says it.
Letters LettersOf(const std::vector<Piece>& pieces) {
  Letters letters = Letters::kAny;
  for (const Piece& piece : pieces) {
    if (piece.prefix == nullptr || piece.prefix->kind != Kind::kLetters) continue;
    letters = ParseLetters(piece.value).value_or(letters);
  }
  return letters;
}

Error Illegal(const char* why) { return {kErrorIllegal, EINVAL, why}; }

}  // namespace

Result<Query> Query::Parse(std::string_view text, std::time_t now) {
  if (text.find('\0') != kNone) return Illegal("a name cannot hold a NUL");
  // Composing a text of nothing but combining marks takes time by the square of its length: three
  // seconds for one of this length.
  if (text.size() > kMostBytes) return Illegal("the pattern is longer than 64 KiB");
  Scanner grouped(text, true, now);
  std::vector<Piece> pieces = grouped.Scan();
  if (!grouped.balanced()) {
    pieces = Scanner(text, false, now).Scan();
  } else if (grouped.deepest() > kDeepestGroup) {
    return Illegal("groups lie too deep in one another");
  }
  Builder builder(now, LettersOf(pieces));
  for (Piece& piece : pieces) {
    if (const Status added = builder.Add(piece); !added) return added.error();
  }
  Query query;
  query.root_ = builder.Finish();
  if (const Status alone = TermsOfWalkAreAlone(query.root_); !alone) return alone.error();
  return query;
}

}  // namespace nas
