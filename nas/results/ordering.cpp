#include "nas/results/ordering.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <utility>

namespace nas {
namespace {

struct KeyedRow {
  std::uint64_t key;
  std::uint32_t row;
};

using KeyedRows = std::vector<KeyedRow>;

// Sorts [begin, end) by key, equal keys in the order they stand. Least significant digit first, one
// byte a pass; passes in which all keys agree are left out, so that sizes and times of a few years
// take three or four of the eight. `spare` is as long as `rows`.
void RadixSort(KeyedRows& rows, size_t begin, size_t end, KeyedRows& spare) {
  constexpr int kDigits = sizeof(KeyedRow::key);
  constexpr int kDigitBits = 8;
  constexpr unsigned kDigitValues = 1U << kDigitBits;
  constexpr unsigned kDigitMask = kDigitValues - 1;
  std::array<std::array<std::uint32_t, kDigitValues>, kDigits> counts{};
  for (size_t i = begin; i < end; ++i) {
    for (int digit = 0; digit < kDigits; ++digit) {
      ++counts[digit][(rows[i].key >> (kDigitBits * digit)) & kDigitMask];
    }
  }
  KeyedRow* from = rows.data() + begin;
  KeyedRow* to = spare.data() + begin;
  const size_t size = end - begin;
  for (int digit = 0; digit < kDigits; ++digit) {
    auto& count = counts[digit];
    if (count[(from->key >> (kDigitBits * digit)) & kDigitMask] == size) continue;
    std::uint32_t before = 0;
    for (std::uint32_t& c : count) before += std::exchange(c, before);
    for (size_t i = 0; i < size; ++i)
      to[count[(from[i].key >> (kDigitBits * digit)) & kDigitMask]++] = from[i];
    std::swap(from, to);
  }
  if (from != rows.data() + begin) std::copy_n(from, size, rows.data() + begin);
}

Ordering RowsOf(const KeyedRows& keyed) {
  Ordering ordering;
  ordering.reserve(keyed.size());
  for (const KeyedRow& row : keyed) ordering.push_back(row.row);
  return ordering;
}

// Runs shorter than this are quicker compared than counted.
constexpr size_t kFewRows = 200;
constexpr size_t kStepBytes = 8;

// The bytes of a key from `at` on, as a number that orders like them.
std::uint64_t Step(std::string_view key, size_t at) {
  std::array<unsigned char, kStepBytes> bytes{};
  if (at < key.size())
    std::memcpy(bytes.data(), key.data() + at, std::min(key.size() - at, kStepBytes));
  std::uint64_t step = 0;
  for (const unsigned char byte : bytes) step = (step << 8) | byte;
  return step;
}

bool Less(const TextKeys& keys, size_t depth, std::uint32_t a, std::uint32_t b) {
  const auto rest = [&keys, depth](std::uint32_t row) {
    const std::string_view key = keys[row];
    return key.substr(std::min(depth, key.size()));
  };
  const int order = rest(a).compare(rest(b));
  return order != 0 ? order < 0 : a < b;
}

// The end of the run of rows from `begin` on that have the same step.
size_t RunEnd(const KeyedRows& rows, size_t begin, size_t end) {
  size_t at = begin + 1;
  while (at < end && rows[at].key == rows[begin].key) ++at;
  return at;
}

// Sorts the rows [begin, end), whose keys agree in their first `depth` bytes: eight bytes at a
// time, and within each run of rows that agree in those, the next eight. Where all rows agree it
// goes on without a call: the common front of paths may be megabytes long.
void SortByText(const TextKeys& keys, KeyedRows& rows, size_t begin, size_t end, size_t depth,
                KeyedRows& spare) {
  for (;; depth += kStepBytes) {
    if (end - begin < kFewRows) {
      std::sort(rows.begin() + static_cast<std::ptrdiff_t>(begin),
                rows.begin() + static_cast<std::ptrdiff_t>(end),
                [&keys, depth](const KeyedRow& a, const KeyedRow& b) {
                  return Less(keys, depth, a.row, b.row);
                });
      return;
    }
    bool longer = false;
    for (size_t i = begin; i < end; ++i) {
      const std::string_view key = keys[rows[i].row];
      rows[i].key = Step(key, depth);
      longer |= key.size() > depth;
    }
    if (!longer) return;  // all equal, and already in the order of their numbers
    if (RunEnd(rows, begin, end) != end) break;
  }
  RadixSort(rows, begin, end, spare);
  for (size_t run = begin; run < end;) {
    const size_t next = RunEnd(rows, run, end);
    if (next - run > 1) SortByText(keys, rows, run, next, depth + kStepBytes, spare);
    run = next;
  }
}

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

// A number becomes "0", the count of its digits without leading zeros, and these digits: "0" keeps
// numbers where digits stand among other characters, and the count orders them by magnitude.
void AppendNatural(std::string_view folded, std::string& key) {
  constexpr size_t kMostDigits = 255;
  for (size_t i = 0; i < folded.size();) {
    const size_t text = i;
    while (i < folded.size() && !IsDigit(folded[i])) ++i;
    key.append(folded, text, i - text);
    if (i == folded.size()) return;
    while (i < folded.size() && folded[i] == '0') ++i;
    size_t end = i;
    while (end < folded.size() && IsDigit(folded[end]) && end - i < kMostDigits) ++end;
    key.push_back('0');
    key.push_back(static_cast<char>(end - i + 1));
    key.append(folded, i, end - i);
    i = end;
  }
}

}  // namespace

Ordering OrderByNumber(const std::vector<std::uint64_t>& keys) {
  if (keys.empty()) return {};
  std::vector<KeyedRow> rows(keys.size());
  for (size_t i = 0; i < keys.size(); ++i) rows[i] = {keys[i], static_cast<std::uint32_t>(i)};
  KeyedRows spare(rows.size());
  RadixSort(rows, 0, rows.size(), spare);
  return RowsOf(rows);
}

void TextKeys::AddNatural(std::string_view text) {
  folded_.Set(text);
  AppendNatural(folded_.folded(), bytes_);
  ends_.push_back(bytes_.size());
}

Ordering TextKeys::Order() const {
  KeyedRows rows(size());
  for (size_t i = 0; i < size(); ++i) rows[i].row = static_cast<std::uint32_t>(i);
  KeyedRows spare(size());
  SortByText(*this, rows, 0, size(), 0, spare);
  return RowsOf(rows);
}

std::vector<std::uint32_t> Ranks(const Ordering& ordering, const TextKeys* keys) {
  std::vector<std::uint32_t> ranks(ordering.size());
  std::uint32_t rank = 0;
  for (size_t i = 0; i < ordering.size(); ++i) {
    const bool equal = keys != nullptr && i > 0 && (*keys)[ordering[i]] == (*keys)[ordering[i - 1]];
    if (!equal) rank = static_cast<std::uint32_t>(i);
    ranks[ordering[i]] = rank;
  }
  return ranks;
}

}  // namespace nas
