#include "nas/engine/ordering.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <utility>

#include "nas/engine/folded_name.h"

namespace nas {
namespace {

struct KeyedRow {
  std::uint64_t key;
  std::uint32_t row;
};

// Least significant digit first, one byte a pass; passes in which all keys agree are left out, so
// that sizes and times of a few years take three or four of the eight.
void RadixSort(std::vector<KeyedRow>& rows) {
  constexpr int kDigits = 8;
  std::array<std::array<std::uint32_t, 256>, kDigits> counts{};
  for (const KeyedRow& row : rows) {
    for (int digit = 0; digit < kDigits; ++digit) ++counts[digit][(row.key >> (8 * digit)) & 255];
  }
  std::vector<KeyedRow> sorted(rows.size());
  for (int digit = 0; digit < kDigits; ++digit) {
    auto& count = counts[digit];
    if (std::ranges::any_of(count, [&](std::uint32_t c) { return c == rows.size(); })) continue;
    std::uint32_t before = 0;
    for (std::uint32_t& c : count) before += std::exchange(c, before);
    for (const KeyedRow& row : rows) sorted[count[(row.key >> (8 * digit)) & 255]++] = row;
    rows.swap(sorted);
  }
}

Ordering RowsOf(const std::vector<KeyedRow>& keyed) {
  Ordering ordering;
  ordering.reserve(keyed.size());
  for (const KeyedRow& row : keyed) ordering.push_back(row.row);
  return ordering;
}

constexpr size_t kPrefixBytes = 8;

// The first bytes of a key as a number that orders like them.
std::uint64_t Prefix(std::string_view key) {
  std::array<unsigned char, kPrefixBytes> bytes{};
  std::memcpy(bytes.data(), key.data(), std::min(key.size(), kPrefixBytes));
  std::uint64_t prefix = 0;
  for (const unsigned char byte : bytes) prefix = (prefix << 8) | byte;
  return prefix;
}

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

}  // namespace

void AppendNaturalKey(std::string_view text, std::string& key) {
  const std::string folded = FoldText(text);
  // A number becomes "0", the count of its digits without leading zeros, and these digits: "0"
  // keeps numbers where digits stand among other characters, and the count orders them by
  // magnitude.
  constexpr size_t kMostDigits = 255;
  for (size_t i = 0; i < folded.size();) {
    if (!IsDigit(folded[i])) {
      key.push_back(folded[i++]);
      continue;
    }
    while (i < folded.size() && folded[i] == '0') ++i;
    size_t end = i;
    while (end < folded.size() && IsDigit(folded[end]) && end - i < kMostDigits) ++end;
    key.push_back('0');
    key.push_back(static_cast<char>(end - i));
    key.append(folded, i, end - i);
    i = end;
  }
}

Ordering OrderByNumber(const std::vector<std::uint64_t>& keys) {
  std::vector<KeyedRow> rows(keys.size());
  for (size_t i = 0; i < keys.size(); ++i) rows[i] = {keys[i], static_cast<std::uint32_t>(i)};
  RadixSort(rows);
  return RowsOf(rows);
}

void TextKeys::AddNatural(std::string_view text) {
  AppendNaturalKey(text, bytes_);
  ends_.push_back(bytes_.size());
}

Ordering TextKeys::Order() const {
  std::vector<KeyedRow> rows(size());
  for (size_t i = 0; i < size(); ++i) rows[i] = {Prefix((*this)[i]), static_cast<std::uint32_t>(i)};
  RadixSort(rows);
  // Only runs of rows that agree in their first bytes need their whole keys compared.
  for (size_t begin = 0; begin < rows.size();) {
    size_t end = begin + 1;
    while (end < rows.size() && rows[end].key == rows[begin].key) ++end;
    if (end - begin > 1) {
      std::sort(rows.begin() + static_cast<std::ptrdiff_t>(begin),
                rows.begin() + static_cast<std::ptrdiff_t>(end),
                [this](const KeyedRow& a, const KeyedRow& b) {
                  const int order = (*this)[a.row].compare((*this)[b.row]);
                  return order != 0 ? order < 0 : a.row < b.row;
                });
    }
    begin = end;
  }
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
