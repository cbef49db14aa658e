#include "nas/match/glob.h"

#include <algorithm>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

constexpr size_t kNone = std::string_view::npos;
// Bytes that are no UTF-8 become characters of their own, beyond all of Unicode.
constexpr char32_t kStrayByte = 0x110000;

// Reads the character at `at` and moves behind it.
char32_t NextCharacter(std::string_view text, size_t& at) {
  const auto lead = static_cast<unsigned char>(text[at++]);
  if (lead < 0x80) return lead;
  const size_t more = lead >= 0xf0 ? 3 : lead >= 0xe0 ? 2 : lead >= 0xc2 ? 1 : 0;
  if (more == 0 || lead > 0xf4 || text.size() - at < more) return kStrayByte + lead;
  char32_t c = lead & (0x3fU >> more);
  for (size_t i = 0; i < more; ++i) {
    const auto next = static_cast<unsigned char>(text[at + i]);
    if ((next & 0xc0) != 0x80) return kStrayByte + lead;
    c = (c << 6) | (next & 0x3fU);
  }
  at += more;
  return c;
}

}  // namespace

size_t Glob::SetEnd(std::string_view pattern, size_t open) {
  size_t first = open + 1;
  if (first < pattern.size() && (pattern[first] == '!' || pattern[first] == '^')) ++first;
  return first < pattern.size() ? pattern.find(']', first + 1) : kNone;
}

bool Glob::HasWildcard(std::string_view text) {
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '*' || text[i] == '?') return true;
    if (text[i] == '[' && SetEnd(text, i) != kNone) return true;
  }
  return false;
}

Glob::Glob(std::string_view pattern) {
  size_t from = 0;
  for (size_t i = 0; i < pattern.size(); ++i) {
    if (pattern[i] == '[') {
      const size_t end = SetEnd(pattern, i);
      if (end != kNone) i = end;
    } else if (pattern[i] == '*') {
      segments_.push_back(ParseSegment(pattern.substr(from, i - from)));
      from = i + 1;
    }
  }
  segments_.push_back(ParseSegment(pattern.substr(from)));
}

Glob::Segment Glob::ParseSegment(std::string_view pattern) {
  Segment segment;
  if (!HasWildcard(pattern)) {
    segment.literal = pattern;
    return segment;
  }
  for (size_t i = 0; i < pattern.size();) {
    Unit unit;
    const size_t end = pattern[i] == '[' ? SetEnd(pattern, i) : kNone;
    if (pattern[i] == '?') {
      unit.any = true;
      ++i;
    } else if (end != kNone) {
      ++i;
      if (pattern[i] == '!' || pattern[i] == '^') {
        unit.negated = true;
        ++i;
      }
      while (i < end) {
        const char32_t low = NextCharacter(pattern, i);
        char32_t high = low;
        if (i + 1 < end && pattern[i] == '-') {
          ++i;
          high = NextCharacter(pattern, i);
        }
        unit.ranges.emplace_back(low, high);
      }
      i = end + 1;
    } else {
      const char32_t c = NextCharacter(pattern, i);
      unit.ranges.emplace_back(c, c);
    }
    for (char32_t c = 0; c < unit.ascii.size(); ++c) unit.ascii[c] = unit.Accepts(c);
    segment.units.push_back(std::move(unit));
  }
  return segment;
}

std::string_view Glob::LongestLiteral() const {
  return std::ranges::max_element(segments_, {}, [](const Segment& s) { return s.literal.size(); })
      ->literal;
}

std::string Glob::LongestText() const {
  std::string longest(LongestLiteral());
  for (const Segment& segment : segments_) {
    std::string run;
    for (const Unit& unit : segment.units) {
      const bool one = !unit.any && !unit.negated && unit.ranges.size() == 1 &&
                       unit.ranges[0].first == unit.ranges[0].second && unit.ranges[0].first < 0x80;
      one ? run.push_back(static_cast<char>(unit.ranges[0].first)) : run.clear();
      if (run.size() > longest.size()) longest = run;
    }
  }
  return longest;
}

namespace {

// As an expression has a byte that stands for itself, in a set or outside.
std::string Escaped(unsigned char byte) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  return {'\\', 'x', kDigits[byte >> 4], kDigits[byte & 0xf]};
}

constexpr std::string_view kInText = "[^\\x00]";
constexpr std::string_view kOtherCharacter = "[\\x80-\\xff]{1,4}";

}  // namespace

bool Glob::Unit::accepts_others() const {
  constexpr char32_t kFirstOther = 0x80;
  return any || negated ||
         std::ranges::any_of(ranges, [](const auto& range) { return range.second >= kFirstOther; });
}

std::string Glob::Unit::Expression() const {
  std::string set;
  for (size_t c = 1; c < ascii.size(); ++c) {
    if (ascii[c]) set += Escaped(static_cast<unsigned char>(c));
  }
  if (!accepts_others()) return set.empty() ? "(?!)" : "[" + set + "]";
  const std::string others(kOtherCharacter);
  return set.empty() ? others : "(?:[" + set + "]|" + others + ")";
}

bool Glob::Segment::HasFixedLength() const {
  return std::ranges::none_of(units, &Unit::accepts_others);
}

std::string Glob::Segment::Expression() const {
  std::string expression;
  for (const char c : literal) expression += Escaped(static_cast<unsigned char>(c));
  for (const Unit& unit : units) expression += unit.Expression();
  return expression;
}

// From wherever the segment before it ends. Of a fixed length, the first place leaves the most for
// what is behind it, so that no other need be tried.
std::string Glob::Segment::ExpressionFurtherOn() const {
  const std::string text = Expression();
  if (literal.size() == 1) return "[^\\x00" + text + "]*+" + text;
  const std::string anywhere = std::string(kInText) + "*?" + text;
  return HasFixedLength() ? "(?>" + anywhere + ")" : anywhere;
}

std::string Glob::Expression(bool alone) const {
  // What lies at a text's begin or end; a name may hold a "\1" too.
  constexpr std::string_view kBegin = "(?<![^\\x00\\x01])";
  constexpr std::string_view kEnd = "(?![^\\x00\\x01])";
  const Segment& first = segments_.front();
  // Nothing tells where such a match may begin, so that every place would be tried.
  if (!first.units.empty() && first.units.front().accepts_others()) return {};
  std::string expression = first.Expression();
  if (segments_.size() == 1) return expression.insert(0, kBegin).append(kEnd);
  const bool anchored = !expression.empty();
  if (anchored) expression.insert(0, kBegin);
  std::string rest;
  bool once = alone && !anchored;  // where it fails once it fails in all of the text
  for (size_t i = 1; i < segments_.size(); ++i) {
    const std::string text = segments_[i].Expression();
    const bool last = i + 1 == segments_.size();
    if (text.empty()) continue;
    once = once && (last ? !expression.empty() : segments_[i].HasFixedLength());
    if (expression.empty()) {
      expression = text;  // which may begin anywhere
    } else if (last) {
      rest.append(kInText).append("*").append(text);
    } else {
      rest.append(segments_[i].ExpressionFurtherOn());
    }
    if (last) rest.append(kEnd);
  }
  if (!once || rest.empty()) return expression + rest;
  return expression.append("(?:").append(rest).append("|[^\\x00]*+(*SKIP)(*FAIL))");
}

bool Glob::Unit::Accepts(char32_t c) const {
  if (any) return true;
  const bool in = std::any_of(ranges.begin(), ranges.end(),
                              [c](const auto& r) { return r.first <= c && c <= r.second; });
  return in != negated;
}

bool Glob::Segment::AcceptsAscii(const char* at) const {
  return std::ranges::all_of(
      units, [&at](const Unit& unit) { return unit.ascii[static_cast<unsigned char>(*at++)]; });
}

size_t Glob::Segment::MatchAt(std::string_view text, size_t at) const {
  if (units.empty()) return text.substr(at).starts_with(literal) ? at + literal.size() : kNone;
  if (IsAscii(text.substr(at, units.size()))) {
    if (text.size() - at < units.size()) return kNone;
    return AcceptsAscii(text.data() + at) ? at + units.size() : kNone;
  }
  for (const Unit& unit : units) {
    if (at == text.size() || !unit.Accepts(NextCharacter(text, at))) return kNone;
  }
  return at;
}

size_t Glob::Segment::FindFrom(std::string_view text, size_t from) const {
  if (units.empty()) {
    const size_t at = text.find(literal, from);
    return at == kNone ? kNone : at + literal.size();
  }
  for (size_t at = from; at < text.size(); NextCharacter(text, at)) {
    const size_t end = MatchAt(text, at);
    if (end != kNone) return end;
  }
  return kNone;
}

bool Glob::Segment::MatchesEnd(std::string_view text, size_t from) const {
  if (units.empty()) return text.substr(from).ends_with(literal);
  // So many characters in ASCII at the end are as many bytes, and no part of others.
  if (text.size() - from >= units.size() && IsAscii(text.substr(text.size() - units.size()))) {
    return AcceptsAscii(text.data() + (text.size() - units.size()));
  }
  for (size_t at = from; at < text.size(); NextCharacter(text, at)) {
    if (MatchAt(text, at) == text.size()) return true;
  }
  return false;
}

bool Glob::Matches(std::string_view text) const {
  size_t at = segments_.front().MatchAt(text, 0);
  if (at == kNone) return false;
  if (segments_.size() == 1) return at == text.size();
  // Taking the first place where each middle segment fits leaves the most for those behind it.
  for (size_t i = 1; i + 1 < segments_.size(); ++i) {
    at = segments_[i].FindFrom(text, at);
    if (at == kNone) return false;
  }
  return segments_.back().MatchesEnd(text, at);
}

}  // namespace nas
