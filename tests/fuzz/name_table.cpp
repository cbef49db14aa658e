// Name tables with any bytes in them. A damaged disk is caught by the sums; these are put right, so
// that what lies behind them is read.

#include <fcntl.h>

#include <cstring>
#include <filesystem>

#include "nas/base/unique_fd.h"
#include "nas/index/name_table.h"
#include "nas/index/table_writer.h"
#include "tests/fuzz/fuzz.h"

namespace {

constexpr char kFileSystem[] = "fuzz";

// Two trees, with names of each kind.
std::string SoundTable() {
  nas::ClassTable classes;
  nas::TableWriter writer;
  const std::uint16_t row = classes.Number({0100644, 1, 2});
  const auto add = [&](std::string_view name) {
    std::string text;
    nas::MakeSearchText(name, text);
    return writer.AddEntry(name, text, {.inode = 7, .size = 1ULL << 33, .row = row});
  };
  const auto folder = [](const char* key) {
    return nas::TableWriter::Folder{.inode = 3, .stamp = {1, 2}, .unreadable = false, .key = key};
  };
  const auto top = writer.AddTop("one", folder("k1"));
  const auto first = add("A");
  const auto second = add("\u00c9t\u00e9");
  writer.AddFolder(top, first, folder("k2"));
  add("plain");
  writer.AddFolder(top, second, folder(""));
  writer.AddTop("two", folder("k3"));
  add("z");
  const nas::UniqueFd to(open(fuzz::Scratch().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  DEMAND(writer.Write(to.get(), "sound", kFileSystem, classes.Rows()).ok());
  std::string bytes(std::filesystem::file_size(fuzz::Scratch() + "/sound"), '\0');
  const nas::UniqueFd file(openat(to.get(), "sound", O_RDONLY | O_CLOEXEC));
  DEMAND(read(file.get(), bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size()));
  return bytes;
}

// The input says what to write where: two bytes of offset, one of length, then the bytes.
std::string Tampered(std::string_view input) {
  static const std::string sound = SoundTable();
  std::string bytes = sound;
  while (input.size() > 3) {
    const size_t at =
        static_cast<unsigned char>(input[0]) * 256U + static_cast<unsigned char>(input[1]);
    const size_t count =
        std::min<size_t>(static_cast<unsigned char>(input[2]) % 16, input.size() - 3);
    if (at + count <= bytes.size()) bytes.replace(at, count, input.substr(3, count));
    input.remove_prefix(3 + count);
  }
  nas::TableHeader header;
  std::memcpy(&header, bytes.data(), sizeof header);
  for (nas::TableHeader::Column& column : header.columns) {
    const size_t count = nas::AlignedColumn(column.bytes);
    if (count < column.bytes || column.begin > bytes.size() ||
        count > bytes.size() - column.begin) {
      continue;
    }
    column.sum = nas::TableSum(bytes.data() + column.begin, count);
  }
  header.sum = nas::TableSum(&header, offsetof(nas::TableHeader, sum));
  std::memcpy(bytes.data(), &header, sizeof header);
  return bytes;
}

void ReadEntries(const nas::NameTable& table) {
  size_t bytes = 0;
  for (nas::NameTable::EntryId id = 0; id < table.entries(); ++id) {
    bytes += table.name(id).size();
    for (const char c : table.name(id)) bytes += static_cast<unsigned char>(c);
    for (const char c : table.texts(id, id + 1)) bytes += static_cast<unsigned char>(c);
    bytes += table.type(id) + table.inode(id) + (table.attributes(id) ? 1U : 0U);
    const auto folder = table.folder_of(id);
    DEMAND(folder < table.folders());
    const auto child = table.folder_at(id);
    DEMAND(child == nas::NameTable::kNoFolder || child < table.folders());
    DEMAND(table.FindEntry(folder, table.name(id)) <= table.entries());
    DEMAND(table.entry_of_text(table.text_begin(id)) == id);
  }
  DEMAND(bytes > 0 || table.entries() == 0);
}

void ReadFolders(const nas::NameTable& table) {
  for (nas::NameTable::FolderId id = 0; id < table.folders(); ++id) {
    DEMAND(table.subtree_end(id) > id && table.subtree_end(id) <= table.folders());
    DEMAND(table.entries_begin(id) <= table.entries_end(id));
    DEMAND(table.parent(id) < id || table.parent(id) == nas::NameTable::kNoFolder);
    const auto found = table.Find(table.key(id));
    DEMAND(found < table.folders() || found == nas::NameTable::kNoFolder);
    DEMAND(table.folder_name(id).size() <= table.bytes());
    DEMAND(!table.stamp(id) || table.stamp(id).nanoseconds < 1'000'000'000);
  }
  for (size_t tree = 0; tree < table.trees(); ++tree) {
    DEMAND(table.top(tree) < table.folders() && table.top_name(tree).size() < table.bytes());
  }
}

}  // namespace

int fuzz::Target(std::string_view input) {
  fuzz::WriteFile(fuzz::Scratch() + "/table", Tampered(input));
  const auto table = nas::NameTable::Open(AT_FDCWD, fuzz::Scratch() + "/table", kFileSystem);
  if (!table) return fuzz::kUsed;
  ReadEntries(*table);
  ReadFolders(*table);
  return fuzz::kUsed;
}
