#include "tests/fuzz/fuzz.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "nas/base/utf8.h"

namespace fuzz {
namespace {

// One that was left open makes it higher.
int LowestFreeDescriptor() {
  const int fd = dup(STDERR_FILENO);
  close(fd);
  return fd;
}

}  // namespace

std::string_view Take(std::string_view* rest, char separator) {
  const std::string_view part = rest->substr(0, rest->find(separator));
  rest->remove_prefix(std::min(rest->size(), part.size() + 1));
  return part;
}

void Demand(bool kept, const char* promise, const char* file, int line) {
  if (kept) return;
  std::fprintf(stderr, "%s:%d: broken: %s\n", file, line, promise);
  std::abort();
}

const std::string& Scratch() {
  static const std::string folder = [] {
    const bool in_memory = access("/dev/shm", W_OK) == 0;
    std::string name =
        (in_memory ? std::filesystem::path("/dev/shm") : std::filesystem::temp_directory_path()) /
        "arbory-fuzz-XXXXXX";
    DEMAND(mkdtemp(name.data()) != nullptr);
    // The folder outlives every other static object that may use it.
    static const std::string kept = name;
    std::atexit([] { std::filesystem::remove_all(kept); });
    return name;
  }();
  return folder;
}

void WriteFile(const std::string& path, std::string_view bytes) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
}

}  // namespace fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  // What a target opens for all inputs is open after the first.
  static const int prepared = fuzz::Target({});
  (void)prepared;
  const int free = fuzz::LowestFreeDescriptor();
  const int used = fuzz::Target({reinterpret_cast<const char*>(data), size});
  DEMAND(fuzz::LowestFreeDescriptor() == free);
  return used;
}
