#include "nas/search/folder_walk.h"

#include <fcntl.h>

#include <memory>
#include <set>
#include <utility>

namespace nas {

namespace {

// Who asks what a search comes close to asks beyond what its terms leave out as well.
Pruning PruningOf(const SharedSearch& search) {
  Pruning pruning = search.criteria.pruning;
  if (search.misses == nullptr) return pruning;
  pruning.excludes.clear();
  pruning.deepest = INT_MAX;
  return pruning;
}

void SetPath(const FolderStack::Item& item, std::string& path) {
  path = item.batch->parent_path;
  if (item.name == ".") return;
  if (!path.empty()) path.push_back('/');
  path.append(item.name);
}

std::string PathOf(const FolderStack::Item& item) {
  std::string path;
  SetPath(item, path);
  return path;
}

}  // namespace

static_assert(FolderStack::kMostThreads >= NameSource::kMostThreads);

FolderWalk::FolderWalk(const std::vector<Location>& locations, bool recursive, SharedSearch& search)
    : FolderWalk(locations, FolderGate(locations, recursive, PruningOf(search)), search) {
  std::set<std::pair<dev_t, ino_t>> known;
  for (size_t i = 0; i < locations.size(); ++i) {
    const bool added = known.emplace(locations[i].device, locations[i].inode).second;
    if (added) Begin(0, static_cast<std::uint16_t>(i));
  }
}

FolderWalk::FolderWalk(const std::vector<Location>& locations, FolderGate gate,
                       SharedSearch& search)
    : locations_(locations), search_(search), gate_(std::move(gate)) {}

void FolderWalk::Begin(size_t thread, std::uint16_t number) {
  const Location& location = locations_[number];
  Add(thread, number, UniqueFd(fcntl(location.fd.get(), F_DUPFD_CLOEXEC, 0)), location.path, ".",
      gate_.IgnoresAbove(location));
}

void FolderWalk::Add(size_t thread, std::uint16_t number, UniqueFd parent, std::string parent_path,
                     std::string_view name, IgnoreFiles::Ptr ignores) {
  auto batch = std::make_shared<FolderBatch>();
  batch->parent = std::move(parent);
  batch->location = number;
  batch->parent_path = std::move(parent_path);
  batch->ignores = std::move(ignores);
  batch->names.append(name).push_back('\0');
  stack_.Push(thread, std::move(batch));
}

void FolderWalk::Feed(size_t thread, Judge& judge) {
  Reading reading{thread, judge, {}, {}};
  FolderStack::Item item;
  while (stack_.Take(thread, item)) {
    FolderGate::Opened folder = gate_.Open(item.batch->parent.get(), item.name.data());
    if (folder.fd) {
      ReadFolder(item, std::move(folder.fd), reading);
    } else if (folder.refusal == Refusal::kFolderUnreadable) {
      search_.CannotRead(folder.error_number, item.batch->location, PathOf(item));
    } else if (folder.refusal != Refusal::kOtherLocation &&
               folder.refusal != Refusal::kOtherMount && folder.refusal != Refusal::kOtherDisk) {
      search_.progress.AddLeftOut();
    }
    if (search_.stopping()) stack_.Abort();
  }
}

void FolderWalk::ReadFolder(const FolderStack::Item& item, UniqueFd fd, Reading& reading) {
  const std::uint16_t number = item.batch->location;
  const Location& location = locations_[number];
  std::string& path = reading.path;
  SetPath(item, path);
  const IgnoreFiles::Ptr ignores = gate_.IgnoresOf(fd.get(), path, item.batch->ignores);
  auto below = std::make_shared<FolderBatch>();
  std::uint64_t entries = 0;
  DirectoryReader::Entry entry;
  reading.reader.Start(fd.get());
  reading.judge.Enter(fd.get(), number, location, path, ignores.get());
  while (reading.reader.Next(entry) && !search_.stopping()) {
    ++entries;
    if (gate_.Below(entry.type, location, path, entry.name, ignores.get()) == Refusal::kNone) {
      below->names.append(entry.name).push_back('\0');
    }
    reading.judge.Entry(entry);
  }
  if (reading.reader.failed() != 0) search_.CannotRead(reading.reader.failed(), number, path);
  search_.progress.AddFolder(entries);
  reading.judge.Leave();
  if (below->names.empty()) return;
  below->location = number;
  below->parent_path = path;
  below->ignores = ignores;
  below->parent = std::move(fd);
  stack_.Push(reading.thread, std::move(below));
}

}  // namespace nas
