// What an index takes to answer: each query given, over a folder whose table is made first. Three
// figures each, the best of several: the table's own part, all with every row looked up, and the
// best hundred.
// Usage: index_queries FOLDER TABLE_FOLDER [QUERY ...]

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <string>
#include <thread>
#include <vector>

#include "nas/index/tree_scan.h"
#include "nas/search/index_best.h"
#include "nas/search/index_names.h"
#include "nas/search/search_job.h"
#include "nas/system/config.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr size_t kBestRows = 100;

class NoRows : public nas::RowSink {
 public:
  void Append(nas::RowBlock& block) override { block.Clear(); }
};

class NoNames : public nas::NameSource {
 public:
  void Feed(size_t /*thread*/, nas::Judge& /*judge*/) override {}
};

// Of all threads; on a machine that does much else, what says the most.
double ProcessorMilliseconds() {
  timespec used{};
  clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &used);
  return static_cast<double>(used.tv_sec) * 1e3 + static_cast<double>(used.tv_nsec) * 1e-6;
}

struct Times {
  double passed = 1e9;
  double used = 1e9;
};

double Milliseconds(Clock::time_point from) {
  return std::chrono::duration<double, std::milli>(Clock::now() - from).count();
}

template <class Run>
Times Best(const Run& run) {
  constexpr int kRuns = 7;
  Times best;
  for (int i = 0; i < kRuns; ++i) {
    const Clock::time_point from = Clock::now();
    const double used = ProcessorMilliseconds();
    run();
    best.passed = std::min(best.passed, Milliseconds(from));
    best.used = std::min(best.used, ProcessorMilliseconds() - used);
  }
  return best;
}

int Fail(const std::string& why) {
  std::fprintf(stderr, "%s\n", why.c_str());
  return 1;
}

nas::Result<nas::NameTable> TableOf(const std::string& folder, const std::string& place_folder) {
  const nas::TablePlace place{AT_FDCWD, place_folder + "/table", "bench"};
  auto table = nas::NameTable::Open(place.dir_fd, place.name, place.file_system);
  if (table) return table;
  const nas::UniqueFd top(open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  const Clock::time_point from = Clock::now();
  if (const auto made = nas::ScanTree({{top.get(), "bench"}}, place); !made) return made.error();
  std::printf("scan %.0f ms\n", Milliseconds(from));
  return nas::NameTable::Open(place.dir_fd, place.name, place.file_system);
}

void Measure(const nas::IndexSnapshot& snapshot, const std::vector<nas::Location>& locations,
             const std::string& text) {
  const auto query = nas::Query::Parse(text);
  if (!query) return;
  const nas::NodeComp comp(query->root());
  NoRows rows;
  const int never = 0;
  const auto top = nas::IndexNames::FolderOf(snapshot, locations.front());
  const nas::IndexNames::Place place{
      locations, top, {}, nas::FolderGate::RulesFor(locations, true)};
  std::uint64_t found = 0;
  const Times whole = Best([&] {
    nas::SharedSearch search({const_cast<nas::NodeComp*>(&comp)}, rows, never);
    nas::IndexNames names(snapshot, place, search);
    NoNames contents;
    nas::SearchJob job(search, {.report = [](const nas::WalkProgress&) {}, .stuck = {}});
    job.Run(names, contents);
    found = search.progress.ToJson()["matches"].asUInt64();
  });
  std::uint64_t may_match = 0;
  const Times table = Best([&] {
    nas::SharedSearch search({const_cast<nas::NodeComp*>(&comp)}, rows, never);
    nas::IndexNames names(snapshot, place, search);
    std::atomic<std::uint64_t> count = 0;
    const auto take = [&] {
      nas::EntryFilter filter(names.filter(), locations.front());
      std::vector<nas::NameTable::EntryId> entries;
      while (names.NextCandidates(filter, &entries) > 0) {
        count += entries.size();
        entries.clear();
      }
    };
    std::jthread other(take);
    take();
    other.join();
    may_match = count;
  });
  nas::BestCount count;
  const Times best = Best([&] {
    nas::SharedSearch search({const_cast<nas::NodeComp*>(&comp)}, rows, never);
    nas::IndexNames names(snapshot, place, search);
    // What it takes where nothing is left out for want of time.
    constexpr std::chrono::milliseconds kEnough(10'000);
    count = nas::FindBest(names, snapshot, locations.front(), search, kBestRows,
                          {.ranking = kEnough, .best = kEnough, .further = {}});
  });
  std::printf(
      "%-34s %9llu rows %9llu candidates  table %7.2f ms (%7.2f processor)  all %7.1f ms "
      "(%7.1f)  best %6.2f ms (%6.2f) %s\n",
      text.c_str(), static_cast<unsigned long long>(found),
      static_cast<unsigned long long>(may_match), table.passed, table.used, whole.passed,
      whole.used, best.passed, best.used, count.more ? "of more" : "of all");
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) return Fail("usage: index_queries FOLDER TABLE_FOLDER [QUERY ...]");
  nas::Config config = nas::DefaultConfig();
  config.state_dir = argv[2];
  config.shares = {{"bench", argv[1]}};
  nas::Configure(config);
  const auto table = TableOf(argv[1], argv[2]);
  if (!table) return Fail(table.error().Text());
  std::vector<nas::Location> locations;
  auto location = nas::OpenLocation("/bench");
  if (!location) return Fail(location.error().Text());
  locations.push_back(std::move(*location));
  const nas::Changes changes;
  const nas::IndexSnapshot snapshot{*table, changes, true};
  std::printf("%u entries in %u folders, table %.1f MB\n", table->entries(), table->folders(),
              static_cast<double>(table->bytes()) / 1e6);
  for (int i = 3; i < argc; ++i) Measure(snapshot, locations, argv[i]);
}
