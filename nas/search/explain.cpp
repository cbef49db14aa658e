#include "nas/search/explain.h"

#include <cerrno>
#include <utility>

#include "nas/files/directory_reader.h"
#include "nas/search/folder_gate.h"
#include "nas/search/judge.h"

namespace nas {
namespace {

// What is found is not kept.
class NoRows : public RowSink {
 public:
  void Append(RowBlock& block) override { block.Clear(); }
};

// One folder on the way, as the walk has it.
class Step {
 public:
  // The entry of that name; fails where it is not listed or the folder cannot be read to its end.
  Result<DirectoryReader::Entry> Find(int folder, std::string_view name) {
    DirectoryReader::Entry entry;
    reader_.Start(folder);
    while (reader_.Next(entry)) {
      if (entry.name == name) return entry;
    }
    return ErrnoError(reader_.failed() != 0 ? reader_.failed() : ENOENT, std::string(name));
  }

 private:
  DirectoryReader reader_;  // holds the entry's name
};

Explanation JudgeEntry(SharedSearch& search, const Location& location, int folder,
                       std::string_view folder_path, const IgnoreFiles* ignores,
                       const DirectoryReader::Entry& entry) {
  Judge judge(search, true);
  judge.Enter(folder, 0, location, folder_path, ignores);
  Explanation found;
  found.refusal = judge.Entry(entry);
  if (found.refusal == Refusal::kContentsUnread) {
    found.refusal = judge.Contents(entry.name.data());
  }
  found.error_number = judge.error_number();
  if (const auto attributes = ReadAttributes(folder, entry.name.data()); attributes) {
    found.attributes = *attributes;
  }
  return found;
}

}  // namespace

Result<Explanation> Explain(const ExplainedSearch& asked, size_t number, std::string_view path) {
  const int never = 0;
  NoRows sink;
  SharedSearch search(asked.comps, sink, never);
  search.AskContents(asked.search_content);
  const FolderGate gate(asked.locations, asked.recursive, search.criteria.pruning);
  const Location& location = asked.locations[number];
  std::string at = location.path;
  IgnoreFiles::Ptr ignores = gate.IgnoresAbove(location);
  FolderGate::Opened folder = gate.Open(location.fd.get(), ".");
  while (folder.fd) {
    Step step;
    const std::string_view name = path.substr(0, path.find('/'));
    const auto entry = step.Find(folder.fd.get(), name);
    const std::string folder_path = at;
    ignores = gate.IgnoresOf(folder.fd.get(), folder_path, ignores);
    at.append(at.empty() ? "" : "/").append(name);
    if (!entry) return Error{entry.error().kind, entry.error().error_number, at};
    if (name.size() == path.size()) {
      Explanation found =
          JudgeEntry(search, location, folder.fd.get(), folder_path, ignores.get(), *entry);
      found.path = at;
      return found;
    }
    path.remove_prefix(name.size() + 1);
    const Refusal below = gate.Below(entry->type, location, folder_path, name, ignores.get());
    if (below == Refusal::kNoFolder) return Error{kErrorNoSuchFolder, ENOTDIR, at};
    if (below != Refusal::kNone) return Explanation{below, at};
    folder = gate.Open(folder.fd.get(), entry->name.data());
  }
  return Explanation{folder.refusal, at, folder.error_number};
}

}  // namespace nas
