#include "nas/match/name_pattern.h"

#include <algorithm>

namespace nas {
namespace {

constexpr std::string_view kRegexPrefix = "regex:";
// Far more than anyone types, and names have 255 bytes. Composing a text of nothing but combining
// marks takes time by the square of its length: three seconds for one of this length.
constexpr size_t kMostPatternBytes = size_t{64} << 10;

// Cuts a pattern into alternatives. Knows quoting and operators, nothing of matching.
class Scanner {
 public:
  explicit Scanner(std::string_view text) : text_(text) {}

  struct Piece {
    enum class Kind { kPlain, kQuoted, kRegex };
    std::string_view text;
    Kind kind = Kind::kPlain;
    bool negated = false;
    bool joined = false;  // an "|" stands between it and the piece before
  };

  // The next alternative that says anything; false at the end.
  bool Next(Piece& piece) {
    bool joined = false;
    while (at_ < text_.size()) {
      if (text_[at_] == ' ') {
        ++at_;
      } else if (text_[at_] == '|') {
        joined = true;
        ++at_;
      } else {
        piece = Read();
        piece.joined = joined;
        if (!piece.text.empty()) return true;
      }
    }
    return false;
  }

 private:
  Piece Read() {
    Piece piece;
    if (text_[at_] == '!' && at_ + 1 < text_.size() && text_[at_ + 1] != ' ' &&
        text_[at_ + 1] != '|') {
      piece.negated = true;
      ++at_;
    }
    const std::string_view rest = text_.substr(at_);
    if (rest.starts_with(kRegexPrefix)) {
      piece.kind = Piece::Kind::kRegex;
      piece.text = rest.substr(kRegexPrefix.size());
      at_ = text_.size();
    } else if (rest.front() == '"') {
      piece.kind = Piece::Kind::kQuoted;
      piece.text = rest.substr(1, rest.find('"', 1) - 1);
      at_ += std::min(rest.size(), piece.text.size() + 2);
    } else {
      piece.text = rest.substr(0, rest.find_first_of(" |"));
      at_ += piece.text.size();
    }
    return piece;
  }

  std::string_view text_;
  size_t at_ = 0;
};

}  // namespace

Result<NamePattern> NamePattern::Parse(std::string_view text) {
  if (text.find('\0') != std::string_view::npos) {
    return Error{kErrorIllegal, EINVAL, "a name cannot hold a NUL"};
  }
  if (text.size() > kMostPatternBytes) {
    return Error{kErrorIllegal, EINVAL, "the pattern is longer than 64 KiB"};
  }
  NamePattern pattern;
  Scanner scanner(text);
  Scanner::Piece piece;
  while (scanner.Next(piece)) {
    Alternative alternative;
    alternative.negated = piece.negated;
    alternative.text = piece.text;
    alternative.folded = FoldText(piece.text);
    if (piece.kind == Scanner::Piece::Kind::kRegex) {
      // Names are compared composed, so the expression has to be.
      auto regex = Regex::Compile(ComposeText(piece.text), Regex::Kind::kName);
      if (!regex) return regex.error();
      alternative.regex = std::move(*regex);
    } else if (piece.kind == Scanner::Piece::Kind::kPlain && Glob::HasWildcard(piece.text)) {
      alternative.glob.emplace(alternative.folded);
    }
    const std::string_view required = alternative.regex  ? std::string_view()
                                      : alternative.glob ? alternative.glob->LongestLiteral()
                                                         : alternative.folded;
    if (!required.empty() && IsAscii(required)) alternative.required.emplace(required);
    if (!piece.joined || pattern.terms_.empty()) pattern.terms_.emplace_back();
    pattern.terms_.back().push_back(std::move(alternative));
  }
  return pattern;
}

bool NamePattern::Alternative::Finds(FoldedName& name) const {
  if (regex) return regex->Finds(name.ascii() ? name.name() : ComposeText(name.name()));
  if (required) {
    const bool there = required->Finds(name.name());
    if (!there && !MayFoldToAscii(name.name())) return false;
    if (there && is_literal() && IsAscii(name.name())) return true;
  }
  const std::string_view compared = name.folded();
  const bool found =
      glob ? glob->Matches(compared) : compared.find(folded) != std::string_view::npos;
  if (found || name.valid_utf8()) return found;
  // Byte by byte: the pattern as it was typed is what the name may hold.
  const std::string bytes = AsciiLower(text);
  return glob ? Glob(bytes).Matches(compared) : compared.find(bytes) != std::string_view::npos;
}

bool NamePattern::Matches(FoldedName& name) const {
  return std::all_of(terms_.begin(), terms_.end(), [&name](const Term& term) {
    return std::any_of(term.begin(), term.end(),
                       [&name](const Alternative& a) { return a.Matches(name); });
  });
}

}  // namespace nas
