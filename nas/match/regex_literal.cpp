#include "nas/match/regex_literal.h"

#include <optional>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

constexpr size_t kNone = std::string_view::npos;

// Escapes of letters and digits that take nothing of what follows them.
constexpr std::string_view kPlainEscapes = "dDwWsSbBAzZhHvVRtnrfae";

bool IsAlnum(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

// Behind the set that begins at `at`; kNone where that is not easily told.
size_t BehindSet(std::string_view text, size_t at) {
  ++at;
  if (at < text.size() && text[at] == '^') ++at;
  if (at < text.size() && text[at] == ']') ++at;
  for (; at < text.size(); ++at) {
    if (text[at] == ']') return at + 1;
    if (text[at] == '[') return kNone;  // perhaps a class of POSIX
    if (text[at] == '\\' && (++at == text.size() || text[at] == 'Q' || text[at] == 'E')) {
      return kNone;
    }
  }
  return kNone;
}

// The last character of the count that begins at `at`; `at` where it is none, and the brace stands
// for itself.
size_t BehindCount(std::string_view text, size_t at) {
  const size_t end = text.find('}', at);
  if (end == kNone) return at;
  const bool count = text.substr(at + 1, end - at - 1).find_first_not_of("0123456789, ") == kNone;
  return count ? end : at;
}

class Reader {
 public:
  Reader(std::string_view text, bool exact) : text_(text), exact_(exact) {}

  std::string Read() {
    if (text_.starts_with("(*")) return {};
    while (at_ < text_.size()) {
      if (!Step()) return {};
    }
    End();
    return best_;
  }

 private:
  // False where nothing can be told of the whole.
  bool Step() {
    switch (const char c = text_[at_]) {
      case '(':
        End();
        if (at_ + 1 < text_.size() && (text_[at_ + 1] == '?' || text_[at_ + 1] == '*')) {
          return false;
        }
        ++depth_;
        break;
      case ')':
        End();
        --depth_;
        break;
      case '[':
        End();
        at_ = BehindSet(text_, at_);
        return at_ != kNone;
      case '|':
        End();
        if (depth_ <= 0) return false;
        break;
      case '?':
      case '*':
      case '{':
        // Perhaps there is none of what stood before.
        if (!run_.empty()) run_.pop_back();
        End();
        if (c == '{') at_ = BehindCount(text_, at_);
        break;
      case '\\':
        return Escape();
      default:
        if (c == '+' || c == '.' || c == '^' || c == '$') {
          End();
        } else {
          Take(c);
        }
    }
    ++at_;
    return true;
  }

  bool Escape() {
    if (++at_ == text_.size()) return false;
    const char c = text_[at_++];
    if (!IsAlnum(c)) {
      Take(c);
      return true;
    }
    End();
    return kPlainEscapes.find(c) != kNone;
  }

  // Other letters than these are equal to "k" and "s" where case does not count: the sign of
  // Kelvin and the long s, which a name that is no UTF-8 keeps.
  void Take(char c) {
    const bool others = !exact_ && (c == 'k' || c == 'K' || c == 's' || c == 'S');
    if (others || static_cast<unsigned char>(c) >= 0x80 || depth_ > 0) {
      End();
    } else {
      run_ += c;
    }
  }

  void End() {
    if (run_.size() > best_.size()) best_ = AsciiLower(run_);
    run_.clear();
  }

  const std::string_view text_;
  const bool exact_;
  size_t at_ = 0;
  int depth_ = 0;
  std::string run_;
  std::string best_;
};

}  // namespace

std::string LiteralOf(std::string_view expression, bool exact) {
  return Reader(expression, exact).Read();
}

}  // namespace nas
