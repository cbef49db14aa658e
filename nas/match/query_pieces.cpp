#include "nas/match/query_pieces.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace nas {
namespace {

using Form = TextTerm::Form;
using Piece = QueryPiece;
constexpr size_t kNone = std::string_view::npos;

class Scanner {
 public:
  Scanner(std::string_view text, bool groups, std::time_t now)
      : text_(text), groups_(groups), now_(now) {}

  std::vector<Piece> Scan() {
    while (at_ < text_.size()) {
      if (text_[at_] == ' ') {
        ++at_;
      } else if (text_[at_] == '|') {
        pieces_.push_back({.kind = Piece::Kind::kBar, .written = text_.substr(at_, 1)});
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
  const size_t value = static_cast<size_t>(term.behind_prefixes.data() - text_.data());
  term.behind_prefixes = text_.substr(value, at_ - closing_ - value);
  if (term.value.empty() && term.prefix == nullptr) term.kind = Piece::Kind::kNothing;
  open_ -= closing_;
  for (; closing_ > 0; --closing_) {
    pieces_.push_back({.kind = Piece::Kind::kClose, .written = text_.substr(at_ - closing_, 1)});
  }
}

void Scanner::ScanTerm(Piece piece) {
  while (TakePrefix(piece)) {
  }
  piece.behind_prefixes = text_.substr(at_);
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
  piece.open = true;
  at_ = text_.size();
}

void Scanner::TakeQuoted(Piece& piece) {
  if (piece.form == Form::kPlain) piece.form = Form::kLiteral;
  const std::string_view rest = text_.substr(at_);
  piece.open = rest.find('"', 1) == kNone;
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
      piece.open = end == text_.size();
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
  piece.open = quoted;
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

}  // namespace

QueryPieces CutQuery(std::string_view text, std::time_t now) {
  Scanner grouped(text, true, now);
  QueryPieces cut{grouped.Scan(), grouped.deepest()};
  if (!grouped.balanced()) cut = {Scanner(text, false, now).Scan(), 0};
  return cut;
}

Letters LettersOf(const std::vector<QueryPiece>& pieces) {
  Letters letters = Letters::kAny;
  for (const QueryPiece& piece : pieces) {
    if (piece.prefix == nullptr || piece.prefix->kind != QueryNode::Kind::kLetters) continue;
    letters = ParseLetters(piece.value).value_or(letters);
  }
  return letters;
}

Result<QueryNode> LeafOf(const QueryPiece& piece, std::time_t now, Letters letters) {
  const bool content = piece.prefix != nullptr && piece.prefix->kind == QueryNode::Kind::kContent;
  const bool is_text = piece.prefix == nullptr || content;
  if (!is_text && piece.prefix->value != QueryPrefix::Value::kExact) {
    return PrefixNode(*piece.prefix, piece.value, now, letters);
  }
  if (piece.value.empty()) return Error{kErrorIllegal, EINVAL, std::string(piece.prefix->help)};
  const Form form = content && piece.form == Form::kPlain ? Form::kLiteral : piece.form;
  const bool exact =
      piece.exact || (!content && IsExact(letters, piece.value, form == Form::kRegex));
  auto text = TextTerm::Make(piece.value, form, exact);
  if (!text) return text.error();
  QueryNode node{.kind = content ? QueryNode::Kind::kContent : QueryNode::Kind::kText};
  node.text = std::move(*text);
  return node;
}

}  // namespace nas
