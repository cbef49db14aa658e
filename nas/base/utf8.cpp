#include "nas/base/utf8.h"

namespace nas {
namespace {

constexpr unsigned char kContinuationLow = 0x80;
constexpr unsigned char kContinuationHigh = 0xBF;

// What a lead byte promises: how many bytes follow, and the range of the first of them, which is
// what tells overlong forms, surrogates and values beyond U+10FFFF apart.
struct Lead {
  size_t following;
  unsigned char low;
  unsigned char high;
};

bool ReadLead(unsigned char byte, Lead* lead) {
  if (byte >= 0xC2 && byte <= 0xDF) {
    *lead = {1, kContinuationLow, kContinuationHigh};
  } else if (byte >= 0xE0 && byte <= 0xEF) {
    *lead = {2, byte == 0xE0 ? static_cast<unsigned char>(0xA0) : kContinuationLow,
             byte == 0xED ? static_cast<unsigned char>(0x9F) : kContinuationHigh};
  } else if (byte >= 0xF0 && byte <= 0xF4) {
    *lead = {3, byte == 0xF0 ? static_cast<unsigned char>(0x90) : kContinuationLow,
             byte == 0xF4 ? static_cast<unsigned char>(0x8F) : kContinuationHigh};
  } else {
    return false;
  }
  return true;
}

}  // namespace

Utf8Step NextUtf8(std::string_view text) {
  const auto first = static_cast<unsigned char>(text[0]);
  if (first < kContinuationLow) return {1, true};
  Lead lead;
  if (!ReadLead(first, &lead)) return {1, false};
  for (size_t at = 1; at <= lead.following; ++at) {
    if (at == text.size()) return {at, false};
    const auto byte = static_cast<unsigned char>(text[at]);
    const unsigned char low = at == 1 ? lead.low : kContinuationLow;
    const unsigned char high = at == 1 ? lead.high : kContinuationHigh;
    if (byte < low || byte > high) return {at, false};
  }
  return {lead.following + 1, true};
}

bool IsUtf8(std::string_view text) {
  while (!text.empty()) {
    const Utf8Step step = NextUtf8(text);
    if (!step.valid) return false;
    text.remove_prefix(step.length);
  }
  return true;
}

}  // namespace nas
