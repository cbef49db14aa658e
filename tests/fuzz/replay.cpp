// Runs a fuzz target over the files of a folder, and over beginnings of each, without libFuzzer:
// any compiler builds it, and the tests do. Usage: fuzz_TARGET FOLDER

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "tests/fuzz/fuzz.h"

namespace {

// Enough to cut a short text behind every byte, and a long one where each part is hit.
constexpr size_t kCuts = 24;

void Run(const std::string& name, const std::string& bytes, size_t size) {
  // The last line that a failed test shows.
  std::printf("%s, %zu of %zu bytes\n", name.c_str(), size, bytes.size());
  std::fflush(stdout);
  // Of just that size, so that a sanitizer sees what reads behind the end.
  const std::vector<std::uint8_t> input(bytes.begin(), bytes.begin() + static_cast<long>(size));
  LLVMFuzzerTestOneInput(input.data(), input.size());
}

}  // namespace

int main(int count, char** arguments) {
  std::vector<std::filesystem::path> seeds;
  for (int i = 1; i < count; ++i) {
    for (const auto& entry : std::filesystem::directory_iterator(arguments[i])) {
      seeds.push_back(entry.path());
    }
  }
  std::sort(seeds.begin(), seeds.end());
  for (const auto& seed : seeds) {
    std::ifstream file(seed, std::ios::binary);
    const std::string bytes{std::istreambuf_iterator<char>(file), {}};
    Run(seed.filename(), bytes, bytes.size());
    for (size_t cut = 0; cut < kCuts; ++cut)
      Run(seed.filename(), bytes, bytes.size() * cut / kCuts);
  }
  std::printf("%zu seeds\n", seeds.size());
  return seeds.empty() ? EXIT_FAILURE : EXIT_SUCCESS;
}
