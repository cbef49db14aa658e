#include "nas/match/regex_scan.h"

#include "nas/match/folded_name.h"
#include "nas/match/pcre.h"

namespace nas {
namespace {

bool IsAlnum(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

// A whole expression, piece by piece; what is not known to be harmless ends it.
class Rewriter {
 public:
  explicit Rewriter(std::string_view text) : text_(text) {}

  std::optional<std::string> Rewrite() {
    if (!IsAscii(text_) || text_.find('\0') != std::string_view::npos) return std::nullopt;
    while (at_ < text_.size()) {
      if (!Step()) return std::nullopt;
    }
    return std::move(out_);
  }

 private:
  bool Step() {
    switch (text_[at_]) {
      case '\\':
        return Escape();
      case '[':
        return Set();
      case '(':
        return Group();
      case '*':
      case '+':
      case '?':
        Take();
        return BehindCount();
      case '{': {
        // One that is no count stands for itself, and is rare.
        const size_t end = text_.find_first_not_of("0123456789,", at_ + 1);
        if (end == std::string_view::npos || text_[end] != '}') return false;
        while (at_ <= end) Take();
        return BehindCount();
      }
      default:
        Take();
        return true;
    }
  }

  // A second "+" keeps what was counted, and so gives up ways to match.
  bool BehindCount() {
    if (at_ < text_.size() && text_[at_] == '?') Take();
    return at_ == text_.size() || text_[at_] != '+';
  }

  bool Group() {
    Take();
    if (at_ == text_.size() || text_[at_] == '*') return false;
    if (text_[at_] != '?') return true;
    if (!text_.substr(at_).starts_with("?:")) return false;
    Take();
    Take();
    return true;
  }

  bool Escape() {
    if (at_ + 1 == text_.size()) return false;
    const char c = text_[at_ + 1];
    constexpr std::string_view kOthers = "DWS";  // which a NUL is too
    if (kOthers.find(c) != std::string_view::npos) {
      out_.append("[^\\x00\\").append(1, static_cast<char>(c - 'A' + 'a')).append("]");
      at_ += 2;
      return true;
    }
    constexpr std::string_view kPlain = "dwsbBt";
    if (IsAlnum(c) && kPlain.find(c) == std::string_view::npos) return false;
    Take();
    Take();
    return true;
  }

  bool Set() {
    Take();
    const bool negated = at_ < text_.size() && text_[at_] == '^';
    if (negated) {
      Take();
      out_.append("\\x00");
    }
    for (bool first = true; at_ < text_.size(); first = false) {
      const char c = text_[at_];
      if (c == ']' && first) {
        // Behind the NUL it would end the set.
        out_.push_back('\\');
      } else if (c == '\\') {
        constexpr std::string_view kPlain = "dwst";
        const char next = at_ + 1 < text_.size() ? text_[at_ + 1] : 'x';
        if (IsAlnum(next) && kPlain.find(next) == std::string_view::npos) return false;
        Take();
      } else if (c == '[' || (c == '-' && first)) {
        return false;
      }
      Take();
      if (c == ']' && !first) return true;
    }
    return false;
  }

  void Take() { out_.push_back(text_[at_++]); }

  const std::string_view text_;
  size_t at_ = 0;
  std::string out_;
};

}  // namespace

std::optional<std::string> ForManyTexts(std::string_view expression) {
  return Rewriter(expression).Rewrite();
}

std::shared_ptr<const RegexScan> RegexScan::Make(std::string_view expression, Texts texts) {
  const auto rewritten = ForManyTexts(expression);
  if (!rewritten) return nullptr;
  const std::uint32_t unicode = texts == Texts::kUtf8 ? PCRE2_UTF | PCRE2_UCP : 0;
  return Compile(*rewritten, PCRE2_CASELESS | PCRE2_MULTILINE | unicode);
}

std::shared_ptr<const RegexScan> RegexScan::OfWildcards(std::string_view expression) {
  return Compile(expression, 0);
}

std::shared_ptr<const RegexScan> RegexScan::Compile(std::string_view expression,
                                                    std::uint32_t options) {
  pcre2_compile_context* context = pcre2_compile_context_create(nullptr);
  if (context == nullptr) return nullptr;
  // "." is anything but the NUL, and "^" and "$" stand beside it.
  pcre2_set_newline(context, PCRE2_NEWLINE_NUL);
  int number = 0;
  PCRE2_SIZE where = 0;
  pcre2_code* code = pcre2_compile(reinterpret_cast<PCRE2_SPTR>(expression.data()),
                                   expression.size(), options, &number, &where, context);
  pcre2_compile_context_free(context);
  if (code == nullptr) return nullptr;
  std::shared_ptr<const RegexScan> scan(new RegexScan(code));
  const bool compiled = pcre2_jit_compile(code, PCRE2_JIT_COMPLETE) == 0;
  // Interpreted it would be no quicker.
  return compiled ? scan : nullptr;
}

RegexScan::~RegexScan() { pcre2_code_free(static_cast<pcre2_code*>(code_)); }

std::optional<size_t> RegexScan::Find(std::string_view texts, size_t from) const {
  PcreScratch& scratch = PcreScratch::OfThread();
  const int found = pcre2_jit_match(static_cast<const pcre2_code*>(code_),
                                    reinterpret_cast<PCRE2_SPTR>(texts.data()), texts.size(), from,
                                    0, scratch.match(), scratch.context());
  if (found == PCRE2_ERROR_NOMATCH) return std::string_view::npos;
  if (found < 0) return std::nullopt;
  return pcre2_get_ovector_pointer(scratch.match())[0];
}

}  // namespace nas
