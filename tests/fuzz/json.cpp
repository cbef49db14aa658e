// JSON texts of requests, records and replies, both ways.

#include <json/reader.h>

#include <cmath>
#include <memory>

#include "nas/base/json_text.h"
#include "tests/fuzz/fuzz.h"

namespace {

using nas::JsonBytes;

// What JSON cannot hold is written as null.
bool HoldsOnlyFinite(const Json::Value& value) {
  if (value.isDouble() && !value.isIntegral()) return std::isfinite(value.asDouble());
  for (const Json::Value& item : value) {
    if (!HoldsOnlyFinite(item)) return false;
  }
  return true;
}

// The library's own reader, as strict as it can be made.
bool ReadStrictly(std::string_view text, Json::Value* value) {
  Json::CharReaderBuilder settings;
  Json::CharReaderBuilder::strictMode(&settings.settings_);
  settings["strictRoot"] = false;
  settings["rejectDupKeys"] = false;
  settings["stackLimit"] = nas::kJsonMaxDepth;
  const std::unique_ptr<Json::CharReader> reader(settings.newCharReader());
  try {
    return reader->parse(text.data(), text.data() + text.size(), value, nullptr);
  } catch (const Json::Exception&) {
    return false;
  }
}

void CheckRoundTrip(const Json::Value& value) {
  const std::string raw = nas::JsonText(value, JsonBytes::kRaw);
  Json::Value again;
  DEMAND(nas::ParseJson(raw, &again));
  DEMAND(!HoldsOnlyFinite(value) || again == value);
  DEMAND(nas::JsonText(again, JsonBytes::kRaw) == raw);

  const std::string clean = nas::JsonText(value, JsonBytes::kClean);
  DEMAND(fuzz::IsValidUtf8(clean));
  DEMAND(nas::ParseJson(clean, &again));
  // Cleaned names may come in another order, or two of them become one; once more changes nothing.
  Json::Value twice;
  DEMAND(nas::ParseJson(nas::JsonText(again, JsonBytes::kClean), &twice));
  DEMAND(!HoldsOnlyFinite(value) || twice == again);
  for (const char byte : raw + clean) DEMAND(static_cast<unsigned char>(byte) >= ' ');
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text = fuzz::Text(data, size);
  Json::Value untouched("untouched");
  Json::Value value = untouched;
  const bool read = nas::ParseJson(text, &value);
  if (!read) DEMAND(value == untouched);
  Json::Value other;
  if (ReadStrictly(text, &other) && text.find('/') == std::string_view::npos) {
    DEMAND(read && value == other);
  }
  if (!read) return fuzz::kUsed;
  CheckRoundTrip(value);
  Json::Value shallow;
  if (nas::ParseJson(text, &shallow, nas::kRequestMaxDepth)) DEMAND(shallow == value);
  return fuzz::kUsed;
}
