#include "nas/base/json_text.h"

#include <json/reader.h>

#include <array>
#include <charconv>
#include <cmath>
#include <memory>
#include <new>
#include <string_view>

#include "nas/base/hex.h"
#include "nas/base/utf8.h"

namespace nas {
namespace {

constexpr unsigned char kFirstPrintable = 0x20;
constexpr unsigned char kFirstNonAscii = 0x80;
constexpr size_t kNumberBytes = 32;  // longest 64-bit integer or shortest exact double

void AppendEscaped(unsigned char byte, std::string* out) {
  switch (byte) {
    case '"':
      *out += "\\\"";
      return;
    case '\\':
      *out += "\\\\";
      return;
    case '\b':
      *out += "\\b";
      return;
    case '\f':
      *out += "\\f";
      return;
    case '\n':
      *out += "\\n";
      return;
    case '\r':
      *out += "\\r";
      return;
    case '\t':
      *out += "\\t";
      return;
    default:
      *out += "\\u00";
      AppendHex(byte, kLowerHex, out);
  }
}

using Bytes = std::array<bool, 256>;

// Bytes of a string that cannot be copied as they are.
constexpr Bytes CareFor(JsonBytes bytes) {
  Bytes care = {};
  for (size_t byte = 0; byte < care.size(); ++byte) {
    care[byte] = byte < kFirstPrintable || byte == '"' || byte == '\\' ||
                 (byte >= kFirstNonAscii && bytes == JsonBytes::kClean);
  }
  return care;
}
constexpr Bytes kCareWhenRaw = CareFor(JsonBytes::kRaw);
constexpr Bytes kCareWhenClean = CareFor(JsonBytes::kClean);

}  // namespace

void AppendJsonString(std::string_view text, JsonBytes bytes, std::string* out) {
  const Bytes& care = bytes == JsonBytes::kRaw ? kCareWhenRaw : kCareWhenClean;
  *out += '"';
  while (!text.empty()) {
    size_t plain = 0;
    while (plain < text.size() && !care[static_cast<unsigned char>(text[plain])]) ++plain;
    out->append(text.substr(0, plain));
    text.remove_prefix(plain);
    if (text.empty()) break;
    const auto byte = static_cast<unsigned char>(text[0]);
    if (byte < kFirstNonAscii) {
      AppendEscaped(byte, out);
      text.remove_prefix(1);
      continue;
    }
    const Utf8Step step = NextUtf8(text);
    out->append(step.valid ? text.substr(0, step.length) : kReplacementCharacter);
    text.remove_prefix(step.length);
  }
  *out += '"';
}

namespace {

template <typename Number>
void AppendNumber(Number number, std::string* out) {
  std::array<char, kNumberBytes> text;
  const auto end = std::to_chars(text.data(), text.data() + text.size(), number).ptr;
  out->append(text.data(), end);
}

void AppendReal(double number, std::string* out) {
  if (!std::isfinite(number)) {
    *out += "null";
    return;
  }
  const size_t start = out->size();
  AppendNumber(number, out);
  // Keeps a real a real when it is read again.
  if (out->find_first_of(".e", start) == std::string::npos) *out += ".0";
}

std::string_view StringOf(const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (!value.getString(&begin, &end)) return {};
  return {begin, static_cast<size_t>(end - begin)};
}

void AppendArray(const Json::Value& value, JsonBytes bytes, std::string* out,
                 const JsonSpill& spill) {
  *out += '[';
  bool first = true;
  for (const Json::Value& item : value) {
    if (!first) *out += ',';
    first = false;
    AppendJson(item, bytes, out, spill);
    if (spill) spill(out);
  }
  *out += ']';
}

void AppendObject(const Json::Value& value, JsonBytes bytes, std::string* out,
                  const JsonSpill& spill) {
  *out += '{';
  bool first = true;
  for (auto member = value.begin(), last = value.end(); member != last; ++member) {
    if (!first) *out += ',';
    first = false;
    const char* end = nullptr;
    const char* begin = member.memberName(&end);
    AppendJsonString({begin, static_cast<size_t>(end - begin)}, bytes, out);
    *out += ':';
    AppendJson(*member, bytes, out, spill);
    if (spill) spill(out);
  }
  *out += '}';
}

// JsonCpp's reader passes over comments inside arrays and objects even when told not to allow them.
// Each value but the first follows a bracket or a comma.
bool HasCommentOrTooMany(std::string_view text) {
  bool in_string = false;
  size_t values = 1;
  for (size_t at = 0; at < text.size(); ++at) {
    const char byte = text[at];
    if (byte == '\\') {
      ++at;
    } else if (byte == '"') {
      in_string = !in_string;
    } else if (!in_string) {
      if (byte == '/') return true;
      if ((byte == ',' || byte == '[' || byte == '{') && ++values > kJsonMaxValues) return true;
    }
  }
  return false;
}

Json::CharReaderBuilder StrictReading() {
  Json::CharReaderBuilder settings;
  settings["collectComments"] = false;
  settings["allowComments"] = false;
  settings["allowTrailingCommas"] = false;
  settings["strictRoot"] = false;
  settings["failIfExtra"] = true;
  settings["rejectDupKeys"] = false;
  return settings;
}

}  // namespace

void AppendJson(const Json::Value& value, JsonBytes bytes, std::string* out,
                const JsonSpill& spill) {
  switch (value.type()) {
    case Json::nullValue:
      *out += "null";
      return;
    case Json::intValue:
      return AppendNumber(value.asLargestInt(), out);
    case Json::uintValue:
      return AppendNumber(value.asLargestUInt(), out);
    case Json::realValue:
      return AppendReal(value.asDouble(), out);
    case Json::stringValue:
      return AppendJsonString(StringOf(value), bytes, out);
    case Json::booleanValue:
      *out += value.asBool() ? "true" : "false";
      return;
    case Json::arrayValue:
      return AppendArray(value, bytes, out, spill);
    case Json::objectValue:
      return AppendObject(value, bytes, out, spill);
  }
}

std::string JsonText(const Json::Value& value, JsonBytes bytes) {
  std::string text;
  AppendJson(value, bytes, &text);
  return text;
}

bool ParseJson(std::string_view text, Json::Value* out, int max_depth) {
  // JsonCpp's reader takes a NUL for the text's end, whatever follows.
  if (HasCommentOrTooMany(text) || text.find('\0') != std::string_view::npos) return false;
  // Made once, as that takes longer than to read a short document.
  thread_local Json::CharReaderBuilder settings = StrictReading();
  settings["stackLimit"] = max_depth;
  const std::unique_ptr<Json::CharReader> reader(settings.newCharReader());
  // The reader throws when a document is too deep, and may leave a half-read value behind.
  try {
    Json::Value value;
    Json::String trouble;
    if (!reader->parse(text.data(), text.data() + text.size(), &value, &trouble)) return false;
    *out = std::move(value);
    return true;
  } catch (const Json::Exception& error) {
    // It has one kind for a document that is too deep and for a string that there is no memory for.
    // Who took the second for the first would take a good record for a damaged one.
    if (std::string_view(error.what()).find("Failed to allocate") == std::string_view::npos) {
      return false;
    }
    throw std::bad_alloc();
  }
}

}  // namespace nas
