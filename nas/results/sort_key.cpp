#include "nas/results/sort_key.h"

#include <sys/stat.h>

#include <algorithm>
#include <utility>

#include "nas/base/accounts.h"
#include "nas/match/file_kinds.h"
#include "nas/match/folded_name.h"
#include "nas/results/ordering.h"

namespace nas {
namespace {

// Of a mode; the others are the file's type.
constexpr std::uint32_t kPermissionBits = 07777;
// Between the parts of a key. Natural keys hold no NUL, so it comes before every other byte.
constexpr char kEndOfPart = '\0';
// Before the key of a type, so that folders, which have none, come first.
constexpr char kHasType = '\1';

std::string Natural(std::string_view text) {
  TextKeys keys;
  keys.AddNatural(text);
  return std::string(keys[0]);
}

std::string PathKey(const KeyedRow& row) {
  std::string path(row.share);
  path.append("/").append(row.folder);
  // "/" has to come before every other character, or "a-b" would stand between "a" and "a/c".
  std::ranges::replace(path, '/', '\x01');
  return Natural(path) + kEndOfPart + Natural(row.name);
}

std::string BigEndian(std::uint64_t number) {
  constexpr int kBitsPerByte = 8;
  std::string bytes(sizeof number, '\0');
  for (size_t i = bytes.size(); i-- > 0; number >>= kBitsPerByte) {
    bytes[i] = static_cast<char>(number);
  }
  return bytes;
}

using KeyOfRow = std::pair<std::string, std::uint32_t>;

KeyOfRow KeyOf(ResultReader& reader, SortColumn column, std::uint32_t number,
               AccountTexts* accounts) {
  const ResultRow row = reader.Row(number);
  KeyedRow keyed{row.share_name, row.folder, row.name, {}, {}, row.attributes};
  if (column == SortColumn::kUser) keyed.user = accounts->User(row.attributes->uid);
  if (column == SortColumn::kGroup) keyed.group = accounts->Group(row.attributes->gid);
  return {SortKey(column, keyed), number};
}

}  // namespace

std::uint64_t NumberSortKey(SortColumn column, const FileAttributes& file) {
  switch (column) {
    case SortColumn::kSize:
      return file.size;
    case SortColumn::kMode:
      return file.mode & kPermissionBits;
    case SortColumn::kAtime:
      return UnsignedKey(file.atime);
    case SortColumn::kMtime:
      return UnsignedKey(file.mtime);
    case SortColumn::kCtime:
      return UnsignedKey(file.ctime);
    case SortColumn::kCrtime:
      return UnsignedKey(file.crtime);
    default:
      return 0;
  }
}

std::string SortKey(SortColumn column, const KeyedRow& row) {
  switch (column) {
    case SortColumn::kFound:
      return {};
    case SortColumn::kName:
      return Natural(row.name);
    case SortColumn::kPath:
      return PathKey(row);
    case SortColumn::kType:
      if (S_ISDIR(row.attributes->mode)) return {};
      return kHasType + Natural(FoldText(ExtensionOf(row.name)));
    case SortColumn::kUser:
      return Natural(row.user);
    case SortColumn::kGroup:
      return Natural(row.group);
    default:
      return BigEndian(NumberSortKey(column, *row.attributes));
  }
}

std::vector<std::uint32_t> FirstRows(ResultReader& reader, SortColumn column, bool ascending,
                                     size_t limit, std::optional<std::uint32_t> after) {
  const auto before = [ascending](const KeyOfRow& one, const KeyOfRow& other) {
    return ascending ? one < other : other < one;
  };
  AccountTexts accounts;
  std::optional<KeyOfRow> last;
  if (after) last = KeyOf(reader, column, *after, &accounts);
  std::vector<KeyOfRow> first;  // a heap whose front is the last of them
  for (std::uint64_t number = 0; number < reader.rows() && limit > 0; ++number) {
    const auto row = static_cast<std::uint32_t>(number);
    if (reader.purged(row)) continue;
    KeyOfRow key = KeyOf(reader, column, row, &accounts);
    if (last && !before(*last, key)) continue;
    if (first.size() == limit) {
      if (!before(key, first.front())) continue;
      std::ranges::pop_heap(first, before);
      first.pop_back();
    }
    first.push_back(std::move(key));
    std::ranges::push_heap(first, before);
  }
  std::ranges::sort_heap(first, before);
  std::vector<std::uint32_t> numbers;
  for (const auto& [key, number] : first) numbers.push_back(number);
  return numbers;
}

}  // namespace nas
