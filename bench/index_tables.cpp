// What name tables cost: index_tables DIR makes one of the tree at DIR, opens it, and merges it
// with few changes. Prints a line for each, the best of several rounds.

#include <fcntl.h>
#include <sys/resource.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <string>

#include "nas/base/unique_fd.h"
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

void Time(const char* what, const std::function<void()>& work) {
  double best = 1e9;
  for (int i = 0; i < kRounds; ++i) {
    const auto start = std::chrono::steady_clock::now();
    work();
    const std::chrono::duration<double, std::milli> took = std::chrono::steady_clock::now() - start;
    best = std::min(best, took.count());
  }
  std::printf("%-28s %9.2f ms   peak %ld kB\n", what, best, PeakKilobytes());
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
  const nas::TablePlace merged{to.get(), "merged", kFileSystem};
  nas::Changes changes;
  Time("merge, nothing", [&] { Demand(nas::MergeTable(*table, changes, false, roots, merged)); });
}
