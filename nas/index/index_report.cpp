#include "nas/index/index_report.h"

#include <unistd.h>

#include <fstream>

#include "nas/base/json_text.h"

namespace nas {
namespace {

constexpr std::uint64_t kBytesPerKilobyte = 1024;

// What the process has beside what it maps of files: its "RssAnon".
std::uint64_t OwnMemory(pid_t pid) {
  constexpr std::string_view kField = "RssAnon:";
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with(kField))
      return std::stoull(line.substr(kField.size())) * kBytesPerKilobyte;
  }
  return 0;
}

// How searches get the attributes that they ask for.
const char* AttributesWords(const Figures& figures) {
  if (!Answers(figures.state)) return "none";
  if (figures.state == IndexState::kCurrent) return "current";
  return figures.by_folder ? "looked up" : "being read";
}

void AddNumbers(const WatcherProcess& watcher, Json::Value* item) {
  const Figures& figures = watcher.figures();
  const std::pair<const char*, std::uint64_t> numbers[] = {
      {"entries", figures.entries},
      {"folders", figures.folders},
      {"changes", figures.changes},
      {"events", figures.events},
      {"watches", figures.watches},
      {"questions", figures.questions},
      {"refused", figures.refused},
      {"table_bytes", figures.table_bytes},
      {"work_ms", figures.work_ms},
      {"memory_bytes", watcher.running() ? OwnMemory(watcher.pid()) : 0},
  };
  for (const auto& [name, number] : numbers) (*item)[name] = Json::UInt64{number};
  (*item)["made_at"] = Json::Int64{figures.made_at};
  (*item)["swept_at"] = Json::Int64{figures.swept_at};
  (*item)["pid"] = watcher.pid();
  (*item)["id"] = watcher.file_system().id;
  (*item)["trees"] = Json::arrayValue;
  for (const std::string& tree : watcher.file_system().trees) (*item)["trees"].append(tree);
}

}  // namespace

std::string IndexReport(const std::vector<const WatcherProcess*>& watchers,
                        const std::vector<Plan::LeftOut>& left_out, bool planned, bool master) {
  Json::Value report;
  bool current = planned;
  report["file_systems"] = Json::arrayValue;
  for (const WatcherProcess* watcher : watchers) {
    const Figures& figures = watcher->figures();
    current = current && (figures.state == IndexState::kCurrent ||
                          (figures.state == IndexState::kNames && figures.by_folder));
    Json::Value item;
    item["type"] = watcher->file_system().type;
    item["state"] = StateWords(figures);
    item["attributes"] = AttributesWords(figures);
    if (master) AddNumbers(*watcher, &item);
    report["file_systems"].append(std::move(item));
  }
  report["current"] = current;
  report["left_out"] = Json::arrayValue;
  for (const Plan::LeftOut& left : left_out) {
    Json::Value item;
    item["why"] = left.why;
    if (master) item["tree"] = left.tree;
    report["left_out"].append(std::move(item));
  }
  return JsonText(report, JsonBytes::kClean);
}

}  // namespace nas
