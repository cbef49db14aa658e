// What name tables cost: index_tables DIR makes one of the tree at DIR, opens it, and merges it
// with few changes. Prints a line for each, the best of several rounds.

#include <fcntl.h>
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <string>

#include "nas/base/unique_fd.h"
#include "nas/index/table_sweep.h"
#include "nas/index/tree_scan.h"

namespace {

constexpr int kRounds = 5;
constexpr char kFileSystem[] = "bench";

void Demand(bool holds, const std::string& what) {
  if (holds) return;
  std::fprintf(stderr, "index_tables: %s\n", what.c_str());
  std::exit(1);
}

void Demand(const nas::Status& status) {
  if (!status) Demand(false, status.error().Text());
}

long PeakKilobytes() {
  rusage usage;
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

double CpuMilliseconds() {
  rusage usage;
  getrusage(RUSAGE_SELF, &usage);
  const auto of = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_usec) / 1e3;
  };
  return of(usage.ru_utime) + of(usage.ru_stime);
}

// The least of several rounds: of the time that passed, and of the processors' time, which tells
// more where others have them too.
void Time(const char* what, const std::function<void()>& work) {
  double passed = HUGE_VAL;
  double cpu = HUGE_VAL;
  for (int i = 0; i < kRounds; ++i) {
    const double before = CpuMilliseconds();
    const auto start = std::chrono::steady_clock::now();
    work();
    const std::chrono::duration<double, std::milli> took = std::chrono::steady_clock::now() - start;
    passed = std::min(passed, took.count());
    cpu = std::min(cpu, CpuMilliseconds() - before);
  }
  std::printf("%-24s %9.2f ms  %9.2f ms cpu  peak %ld kB\n", what, passed, cpu, PeakKilobytes());
  std::fflush(stdout);
}

void MeasureMerges(const nas::NameTable& table, const std::vector<nas::TableRoot>& roots,
                   const nas::TablePlace& place) {
  nas::Changes changes;
  for (const unsigned count : {0U, 1'000U, 10'000U}) {
    for (unsigned i = 0; i < count; ++i) {
      changes.AddName(static_cast<unsigned>(std::uint64_t{i} * table.folders() / count), "x");
    }
    const std::string what = "merge, " + std::to_string(count) + " folders";
    Time(what.c_str(), [&] { Demand(nas::MergeTable(table, changes, false, roots, place)); });
  }
}

}  // namespace

int main(int argc, char** argv) {
  Demand(argc == 3, "which folder, and where to?");
  const nas::UniqueFd root(open(argv[1], O_PATH | O_DIRECTORY | O_CLOEXEC));
  const nas::UniqueFd to(open(argv[2], O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  Demand(root && to, "cannot open");
  const std::vector<nas::TableRoot> roots = {{root.get(), "tree"}};
  const nas::TablePlace place{to.get(), "names", kFileSystem};
  Time("scan", [&] { Demand(nas::ScanTree(roots, place)); });
  Time("open", [&] { Demand(nas::NameTable::Open(to.get(), "names", kFileSystem).ok(), "open"); });
  const auto table = nas::NameTable::Open(to.get(), "names", kFileSystem);
  std::printf("%u entries, %u folders, %zu bytes, %.1f an entry\n", table->entries(),
              table->folders(), table->bytes(),
              static_cast<double>(table->bytes()) / table->entries());
  Time("sweep", [&] { Demand(nas::SweepFolders(*table, roots).ok(), "sweep"); });
  MeasureMerges(*table, roots, {to.get(), "merged", kFileSystem});
}
