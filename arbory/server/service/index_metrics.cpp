#include "arbory/server/service/index_metrics.h"

#include <cstdint>

#include "nas/base/json_text.h"
#include "nas/index/client.h"

namespace arbory {
namespace {

// The loop waits for it, so a daemon that hangs must cost little.
constexpr int kPatienceMilliseconds = 50;

struct Figure {
  const char* member;  // of the report's file systems
  const char* name;
  const char* type;
  const char* help;
};
constexpr Figure kFigures[] = {
    {"entries", "arbory_index_entries", "gauge", "Names in the table."},
    {"folders", "arbory_index_folders", "gauge", "Folders in the table."},
    {"changes", "arbory_index_changes", "gauge", "Changes noted since the table was made."},
    {"events", "arbory_index_events_total", "counter", "Events taken."},
    {"questions", "arbory_index_questions_total", "counter", "Questions answered."},
    {"refused", "arbory_index_refused_total", "counter", "Questions told to walk."},
    {"memory_bytes", "arbory_index_memory_bytes", "gauge", "Memory beside the table."},
    {"table_bytes", "arbory_index_table_bytes", "gauge", "The table's file."},
    {"made_at", "arbory_index_made_seconds", "gauge", "When the table was made."},
    {"swept_at", "arbory_index_compared_seconds", "gauge", "When it was last compared."},
};

Json::Value AskForReport() {
  const auto text = nas::AskDaemon(nas::HelloKind::kReport, kPatienceMilliseconds);
  Json::Value report;
  return text && nas::ParseJson(*text, &report) ? report : Json::Value();
}

}  // namespace

std::string IndexMetrics() {
  const Json::Value report = AskForReport();
  if (report.isNull()) return {};
  std::string out =
      "# HELP arbory_index_current Whether everything that is to be indexed is.\n"
      "# TYPE arbory_index_current gauge\narbory_index_current ";
  out += report["current"].asBool() ? "1\n" : "0\n";
  for (const Figure& figure : kFigures) {
    out += std::string("# HELP ") + figure.name + " " + figure.help + "\n# TYPE " + figure.name +
           " " + figure.type + "\n";
    for (const Json::Value& item : report["file_systems"]) {
      if (!item.isMember(figure.member)) continue;
      out += std::string(figure.name) + "{id=\"" + item["id"].asString() + "\",type=\"" +
             item["type"].asString() + "\"} " + item[figure.member].asString() + "\n";
    }
  }
  return out;
}

void AddIndexState(Json::Value* body) {
  const Json::Value report = AskForReport();
  if (report.isNull()) return;
  std::uint64_t names = 0;
  std::string state = "current";
  for (const Json::Value& item : report["file_systems"]) {
    names += item["entries"].asUInt64();
    const std::string its = item["state"].asString();
    if (!report["current"].asBool() && its != nas::kIndexCurrent) state = its;
  }
  (*body)["names"] = Json::UInt64{names};
  (*body)["index"] = state;
}

}  // namespace arbory
