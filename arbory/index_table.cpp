#include "arbory/index_table.h"

#include <array>
#include <cstdio>

#include "arbory/terminal.h"

namespace arbory {
namespace {

std::string Megabytes(const Json::Value& bytes) {
  constexpr double kMegabyte = 1 << 20;
  constexpr size_t kRoom = 32;
  std::array<char, kRoom> text;
  std::snprintf(text.data(), text.size(), "%.1f MB", bytes.asDouble() / kMegabyte);
  return text.data();
}

std::string Ago(const Json::Value& time, std::time_t now) {
  constexpr std::time_t kMinute = 60;
  constexpr std::time_t kHour = 60 * kMinute;
  constexpr std::time_t kDay = 24 * kHour;
  if (time.asInt64() == 0) return "never";
  const std::time_t age = now - time.asInt64();
  if (age < 2 * kMinute) return std::to_string(age) + " s ago";
  if (age < 2 * kHour) return std::to_string(age / kMinute) + " min ago";
  if (age < 2 * kDay) return std::to_string(age / kHour) + " h ago";
  return std::to_string(age / kDay) + " days ago";
}

void AddNumbers(const Json::Value& item, std::time_t now, std::string* out) {
  const auto line = [out](const std::string& name, const std::string& value) {
    constexpr size_t kColumn = 12;
    *out += "  " + name + std::string(kColumn - name.size(), ' ') + value + "\n";
  };
  line("entries", item["entries"].asString() + " in " + item["folders"].asString() + " folders");
  line("changes",
       item["changes"].asString() + " since the table was made, " + Ago(item["made_at"], now));
  line("compared", Ago(item["swept_at"], now));
  line("events", item["events"].asString() +
                     (item["watches"].asUInt64() == 0
                          ? std::string()
                          : ", of " + item["watches"].asString() + " watched folders"));
  line("questions",
       item["questions"].asString() + ", and " + item["refused"].asString() + " told to walk");
  line("memory", Megabytes(item["memory_bytes"]));
  line("disk", Megabytes(item["table_bytes"]));
}

}  // namespace

std::string IndexTable(const Json::Value& report, std::time_t now) {
  std::string out;
  for (const Json::Value& item : report["file_systems"]) {
    std::string name = item["type"].asString();
    for (const Json::Value& tree : item["trees"]) name += " " + Escaped(tree.asString());
    out += name + ": " + item["state"].asString() + ", attributes " +
           item["attributes"].asString() + "\n";
    if (item.isMember("entries")) AddNumbers(item, now, &out);
  }
  for (const Json::Value& left : report["left_out"]) {
    out +=
        "not indexed: " + Escaped(left["tree"].asString()) + " (" + left["why"].asString() + ")\n";
  }
  if (report["file_systems"].empty() && report["left_out"].empty()) out += "nothing to index\n";
  return out;
}

}  // namespace arbory
