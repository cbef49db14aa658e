// JSON texts of requests, records and replies, both ways.

#include <json/reader.h>

#include <memory>

#include "nas/base/json_text.h"
#include "nas/base/utf8.h"
#include "tests/fuzz/fuzz.h"

namespace {

using nas::JsonBytes;

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
  // What JSON cannot hold, as a number beyond all, is written as null.
  DEMAND(again == value || raw.find("null") != std::string::npos);
  DEMAND(nas::JsonText(again, JsonBytes::kRaw) == raw);

  const std::string clean = nas::JsonText(value, JsonBytes::kClean);
  DEMAND(nas::IsUtf8(clean));
  Json::Value cleaned;
  DEMAND(nas::ParseJson(clean, &cleaned));
  // Cleaned names may come in another order, or two of them become one; once more changes nothing.
  Json::Value twice;
  DEMAND(nas::ParseJson(nas::JsonText(cleaned, JsonBytes::kClean), &twice));
  DEMAND(twice == cleaned);
  for (const char byte : raw + clean) DEMAND(static_cast<unsigned char>(byte) >= ' ');
}

}  // namespace

int fuzz::Target(std::string_view text) {
  Json::Value untouched("untouched");
  Json::Value value = untouched;
  const bool read = nas::ParseJson(text, &value);
  if (!read) DEMAND(value == untouched);
  Json::Value other;
  // It takes comments, and a NUL in a string, which JSON has not.
  const bool beyond = text.find_first_of(std::string_view("/\0", 2)) != std::string_view::npos;
  if (ReadStrictly(text, &other) && !beyond) {
    DEMAND(read && value == other);
  }
  if (!read) return fuzz::kUsed;
  CheckRoundTrip(value);
  Json::Value shallow;
  if (nas::ParseJson(text, &shallow, nas::kRequestMaxDepth)) DEMAND(shallow == value);
  return fuzz::kUsed;
}
