// How a search answers a client that talks to the module: first page, pages while it runs, sorted
// pages when it has finished, stopping, and the worker's memory.
//
//   service MODULE STATE_DIR TREE     searches TREE for everything
//   service MODULE STATE_DIR TREE stop   starts, stops after 100 ms, and tells how long that took
//
// Prints one line a measurement: name, tab, value, tab, unit.

#include <poll.h>
#include <pwd.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "nas/system/config.h"
#include "nas/webapi/module.h"
#include "nas/webapi/runner.h"
#include "platform/task.h"
#include "platform/task_record.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kRounds = 5;
constexpr int kPageRows = 100;
constexpr unsigned kLargePageRows = 10'000;
// Between two looks of a client that shows how a search goes on.
constexpr std::chrono::milliseconds kListPause(20);
// Into a search before it is stopped: every thread is at work then.
constexpr std::chrono::milliseconds kStopAfter(100);

double Milliseconds(Clock::duration d) {
  return std::chrono::duration<double, std::milli>(d).count();
}

void Print(const std::string& name, double value, const char* unit) {
  std::printf("%s\t%.1f\t%s\n", name.c_str(), value, unit);
  std::fflush(stdout);
}

// What a page tells, in few bytes: the page itself has been made whole in the child.
nas::Reply Summary(int code, const Json::Value& data) {
  if (code != 0) return {{.code = code}, "error " + std::to_string(code)};
  if (data.isMember("taskid")) return {{}, data["taskid"].asString()};
  return {{},
          std::to_string(data["files"].size()) + " " + std::to_string(data["total"].asUInt()) +
              " " + (data["finished"].asBool() ? "1" : "0")};
}

struct Page {
  unsigned rows = 0;
  unsigned total = 0;
  int finished = 0;
  double milliseconds = 0;
};

class Client {
 public:
  Client(const std::string& module, std::string user) : module_(module), user_(std::move(user)) {}

  std::string Call(const char* method, const Json::Value& params) {
    const NUVA::APIMethod* row = module_.Find("NUVA.Arbory.Search", 2, method);
    if (row == nullptr) throw std::runtime_error("no such method");
    return nas::RunCall(*row, {method, params, user_, "bench"}, Summary).body;
  }

  void Start(const std::string& location) {
    Json::Value params;
    params["folder_path"].append(location);
    params["pattern"] = "";
    params["search_content"] = false;
    id_ = Call("start", params);
    if (id_.size() != 32) throw std::runtime_error("start: " + id_);
  }

  Page List(std::uint64_t offset, std::uint64_t limit, const std::string& column = "",
            const std::string& direction = "") {
    Json::Value params;
    params["taskid"] = id_;
    params["offset"] = Json::UInt64{offset};
    params["limit"] = Json::UInt64{limit};
    params["sort_by"] = column;
    params["sort_direction"] = direction;
    for (const char* name : {"real_path", "size", "time", "owner", "type"}) {
      params["additional"].append(name);
    }
    const Clock::time_point begun = Clock::now();
    const std::string reply = Call("list", params);
    Page page;
    page.milliseconds = Milliseconds(Clock::now() - begun);
    if (std::sscanf(reply.c_str(), "%u %u %d", &page.rows, &page.total, &page.finished) != 3) {
      throw std::runtime_error("list: " + reply);
    }
    return page;
  }

  void Finish(const char* method) {
    Json::Value params;
    params["taskid"] = id_;
    Call(method, params);
  }

  Json::Value Data() const {
    const std::unique_ptr<OKT::Task> task(
        OKT::TaskMgr(user_.c_str()).getTaskWithThrow(id_.c_str()));
    return task->getProperty(task_record::kData);
  }

 private:
  nas::Module module_;
  const std::string user_;
  std::string id_;
};

double PeakMegabytes(int pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  std::string word;
  while (status >> word) {
    if (word == "VmHWM:") {
      double kilobytes = 0;
      status >> kilobytes;
      return kilobytes / 1024;
    }
  }
  return 0;
}

void MeasureRunning(Client& client) {
  const Clock::time_point begun = Clock::now();
  client.Start("/tree");
  Page page = client.List(0, kPageRows);
  while (page.rows == 0 && page.finished == 0) page = client.List(0, kPageRows);
  Print("first page with rows, from start", Milliseconds(Clock::now() - begun), "ms");

  const int pid = client.Data()[task_record::kPid].asInt();
  std::uint64_t offset = page.rows;
  double slowest = 0;
  double peak = 0;
  std::vector<double> pages;
  while (page.finished == 0) {
    page = client.List(offset, kPageRows);
    if (page.finished == 0) pages.push_back(page.milliseconds);
    slowest = std::max(slowest, page.milliseconds);
    offset += page.rows;
    peak = std::max(peak, PeakMegabytes(pid));
    std::this_thread::sleep_for(kListPause);
  }
  std::ranges::sort(pages);
  Print("search of everything, listed meanwhile", Milliseconds(Clock::now() - begun), "ms");
  Print("page while running, median", pages.empty() ? 0 : pages[pages.size() / 2], "ms");
  Print("page while running, slowest", slowest, "ms");
  Print("peak memory of the worker", peak, "MiB");
  Print("rows", page.total, "");
}

// Begins at once after the end of the search.
void MeasureSorted(Client& client) {
  const unsigned total = client.List(0, 1).total;
  const std::array<std::uint64_t, 3> offsets = {0, total / 2, total - std::min(total, 100U)};
  for (const char* column : {"", "name", "path", "size", "type", "user", "group", "mode", "atime",
                             "mtime", "ctime", "crtime"}) {
    const std::string name = *column == '\0' ? "found" : column;
    Print("first page by " + name, client.List(0, kPageRows, column, "ASC").milliseconds, "ms");
    std::vector<double> times;
    for (int round = 0; round < kRounds; ++round) {
      for (const char* direction : {"ASC", "DESC"}) {
        for (const std::uint64_t offset : offsets) {
          times.push_back(client.List(offset, kPageRows, column, direction).milliseconds);
        }
      }
    }
    std::ranges::sort(times);
    Print("page by " + name + ", median", times[times.size() / 2], "ms");
    Print("page by " + name + ", slowest", times.back(), "ms");
  }
  std::vector<double> large;
  for (unsigned offset = 0; offset < std::min(total, 10 * kLargePageRows);
       offset += kLargePageRows) {
    large.push_back(client.List(offset, kLargePageRows).milliseconds);
  }
  std::ranges::sort(large);
  Print("page of 10,000 rows, median", large[large.size() / 2], "ms");
}

void MeasureStop(Client& client) {
  client.Start("/tree");
  std::this_thread::sleep_for(kStopAfter);
  pollfd worker{
      static_cast<int>(syscall(SYS_pidfd_open, client.Data()[task_record::kPid].asInt(), 0)),
      POLLIN, 0};
  const Clock::time_point begun = Clock::now();
  client.Finish("stop");
  poll(&worker, 1, -1);
  Print("from stop to worker gone", Milliseconds(Clock::now() - begun), "ms");
}

}  // namespace

int main(int argc, char** argv) try {
  if (argc < 4) {
    std::fprintf(stderr, "usage: service MODULE STATE_DIR TREE [stop]\n");
    return 2;
  }
  nas::Config config;
  config.state_dir = argv[2];
  config.volumes.clear();
  config.shares = {{"tree", argv[3]}};
  nas::Configure(config);
  const passwd* user = getpwuid(getuid());
  Client client(argv[1], user->pw_name);
  if (argc > 4) {
    MeasureStop(client);
  } else {
    MeasureRunning(client);
    MeasureSorted(client);
  }
  client.Finish("clean");
  return 0;
} catch (const std::exception& error) {
  std::fprintf(stderr, "service: %s\n", error.what());
  return 1;
}
