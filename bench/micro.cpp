// The innermost loops by themselves: one name against a pattern, one buffer against a literal, one
// column of a million rows in order.

#include <benchmark/benchmark.h>

#include <random>
#include <string>
#include <string_view>

#include "nas/match/literal_finder.h"
#include "nas/match/query_match.h"
#include "nas/results/ordering.h"

namespace {

void MatchName(benchmark::State& state, const char* pattern_text, const char* name) {
  const auto query = nas::Query::Parse(pattern_text);
  nas::FoldedName folded;
  nas::QuerySubject subject;
  subject.name = &folded;
  for (auto _ : state) {
    folded.Set(name);
    benchmark::DoNotOptimize(nas::Ask(query->root(), subject));
  }
}
BENCHMARK_CAPTURE(MatchName, literal_miss, "invoice", "holiday_photo-123456.jpg");
BENCHMARK_CAPTURE(MatchName, literal_hit, "invoice", "2024-INVOICE-123456.pdf");
BENCHMARK_CAPTURE(MatchName, literal_miss_not_ascii, "invoice",
                  "\u0420\u0435\u0301sum\u00e9-1.txt");
BENCHMARK_CAPTURE(MatchName, letter_hit_not_ascii, "\u00e9", "re\u0301sume\u0301-1.txt");
BENCHMARK_CAPTURE(MatchName, glob_miss, "*.conf", "holiday_photo-123456.jpg");
BENCHMARK_CAPTURE(MatchName, regex_miss, "regex:^img_\\d+$", "holiday_photo-123456.jpg");

void FindLiteral(benchmark::State& state) {
  constexpr std::string_view kLetters = " etaoinsrh\n";  // the usual ones of a text
  constexpr size_t kBufferBytes = 256 * 1024;            // stays in the processor's cache
  std::mt19937 random(1);
  std::string buffer;
  while (buffer.size() < kBufferBytes) buffer.push_back(kLetters[random() % kLetters.size()]);
  const nas::LiteralFinder finder("spinlock_irqsave");
  for (auto _ : state) benchmark::DoNotOptimize(finder.Finds(buffer));
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * buffer.size()));
}
BENCHMARK(FindLiteral);

constexpr int kRows = 1'000'000;
constexpr std::uint64_t kMostBytes = 4'000'000'000;  // sizes of films and below

void OrderNumbers(benchmark::State& state) {
  std::mt19937_64 random(1);
  std::vector<std::uint64_t> keys(kRows);
  for (auto& key : keys) key = random() % kMostBytes;
  for (auto _ : state) benchmark::DoNotOptimize(nas::OrderByNumber(keys));
}
BENCHMARK(OrderNumbers)->Unit(benchmark::kMillisecond);

void OrderNames(benchmark::State& state) {
  std::mt19937_64 random(1);
  for (auto _ : state) {
    nas::TextKeys keys;
    for (int i = 0; i < kRows; ++i) {
      keys.AddNatural((i % 3 == 0 ? "IMG_" : "holiday report ") + std::to_string(random() % kRows));
    }
    benchmark::DoNotOptimize(keys.Order());
  }
}
BENCHMARK(OrderNames)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
