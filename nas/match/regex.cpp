#include "nas/match/regex.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <string>

#include "nas/match/folded_name.h"
#include "nas/match/pcre.h"

namespace nas {
namespace {

// Longer ones are cut.
constexpr size_t kMostMessageBytes = 256;

std::uint32_t CompileOptions(Regex::Kind kind) {
  constexpr std::uint32_t kCommon =
      PCRE2_UTF | PCRE2_UCP | PCRE2_CASELESS | PCRE2_MATCH_INVALID_UTF | PCRE2_NEVER_BACKSLASH_C;
  switch (kind) {
    case Regex::Kind::kName:
      return kCommon | PCRE2_DOTALL | PCRE2_DOLLAR_ENDONLY;
    case Regex::Kind::kContent:
      return kCommon | PCRE2_MULTILINE;
    case Regex::Kind::kLiteral:
      return PCRE2_UTF | PCRE2_CASELESS | PCRE2_MATCH_INVALID_UTF | PCRE2_LITERAL;
  }
  return kCommon;
}

// Null, with the number and place of the error, for a broken expression.
pcre2_code* CompileFor(std::string_view pattern, std::uint32_t options, int& number,
                       PCRE2_SIZE& where) {
  pcre2_code* code = pcre2_compile(reinterpret_cast<PCRE2_SPTR>(pattern.data()), pattern.size(),
                                   options, &number, &where, nullptr);
  // Where no machine code can be made the expression is interpreted: slower, never wrong.
  if (code != nullptr) pcre2_jit_compile(code, PCRE2_JIT_COMPLETE);
  return code;
}

}  // namespace

Result<std::shared_ptr<const Regex>> Regex::Compile(std::string_view pattern, Kind kind,
                                                    bool exact_case) {
  int number = 0;
  PCRE2_SIZE where = 0;
  const std::uint32_t options =
      CompileOptions(kind) & ~(exact_case ? std::uint32_t{PCRE2_CASELESS} : 0U);
  pcre2_code* code = CompileFor(pattern, options, number, where);
  if (code == nullptr) {
    std::array<PCRE2_UCHAR, kMostMessageBytes> text{};
    pcre2_get_error_message(number, text.data(), text.size());
    return Error{kErrorIllegal, EINVAL,
                 std::string(reinterpret_cast<const char*>(text.data())) + " at character " +
                     std::to_string(where)};
  }
  constexpr std::uint32_t kUnicode = PCRE2_UTF | PCRE2_UCP | PCRE2_MATCH_INVALID_UTF;
  pcre2_code* ascii_code =
      IsAscii(pattern) ? CompileFor(pattern, options & ~kUnicode, number, where) : nullptr;
  return std::shared_ptr<const Regex>(new Regex(code, ascii_code));
}

Regex::~Regex() {
  pcre2_code_free(static_cast<pcre2_code*>(code_));
  pcre2_code_free(static_cast<pcre2_code*>(ascii_code_));
}

std::optional<TextPlace> Regex::Find(std::string_view text, size_t from) const {
  PcreScratch& scratch = PcreScratch::OfThread();
  const void* code = ascii_code_ != nullptr && IsAscii(text) ? ascii_code_ : code_;
  if (pcre2_match(static_cast<const pcre2_code*>(code), reinterpret_cast<PCRE2_SPTR>(text.data()),
                  text.size(), from, 0, scratch.match(), scratch.context()) < 0) {
    return std::nullopt;
  }
  const PCRE2_SIZE* ends = pcre2_get_ovector_pointer(scratch.match());
  // \K may put the beginning behind the end.
  return TextPlace{ends[0], ends[1] - std::min(ends[0], ends[1])};
}

}  // namespace nas
