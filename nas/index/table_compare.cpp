#include "nas/index/table_compare.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <map>
#include <optional>

#include "nas/files/beneath.h"
#include "nas/files/directory_reader.h"
#include "nas/index/folder_queue.h"
#include "nas/index/folder_reader.h"
#include "nas/index/open_path.h"

namespace nas {
namespace {

using FolderId = NameTable::FolderId;
using EntryId = NameTable::EntryId;
using Kind = TableDifference::Kind;

struct ComparedFolder {
  FolderId id = NameTable::kNoFolder;
  size_t tree = 0;
};

// An entry as the file system has it.
struct FoundEntry {
  std::uint64_t inode = 0;
  unsigned char type = DT_UNKNOWN;
  std::optional<NameTable::Attributes> attributes;  // nothing where the table may not have them
};

constexpr int kStatFlags = AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT | AT_STATX_DONT_SYNC;

std::optional<NameTable::Attributes> AttributesOf(const struct statx& status) {
  if (status.stx_nlink > 1 && !S_ISDIR(status.stx_mode)) return std::nullopt;
  NameTable::Attributes found{.size = status.stx_size,
                              .mtime = status.stx_mtime.tv_sec,
                              .mode = status.stx_mode,
                              .uid = status.stx_uid,
                              .gid = status.stx_gid};
  if ((status.stx_mask & STATX_BTIME) != 0) found.crtime = status.stx_btime.tv_sec;
  return found;
}

class Comparison {
 public:
  Comparison(const NameTable& table, const Changes& changes, bool attributes,
             const std::vector<TableRoot>& roots,
             const std::function<void(const TableDifference&)>& told, const std::atomic<bool>* stop)
      : table_(table),
        changes_(changes),
        attributes_(attributes),
        roots_(roots),
        told_(told),
        stop_(stop) {}

  Status Run();

 private:
  using Queue = FolderQueue<ComparedFolder>;

  void CompareFolder(const Queue::Task& task);
  UniqueFd Open(const Queue::Task& task) const;
  bool IsSame(const ComparedFolder& folder, int fd) const;
  std::map<std::string, FoundEntry> Find(const ComparedFolder& folder, int fd) const;
  void CompareEntries(const ComparedFolder& folder, UniqueFd fd);
  void CompareEntry(const ComparedFolder& folder, int fd, EntryId id, const FoundEntry& found);
  bool HasSameAttributes(EntryId id, const FoundEntry& found) const;
  bool IsOfTree(const ComparedFolder& folder, int fd, const char* name) const;
  bool IsInOrder(FolderId folder, EntryId id) const;
  bool IsCovered(FolderId folder, std::string_view name) const;
  bool IsWhole(FolderId folder) const;
  void Tell(Kind kind, const ComparedFolder& folder, std::string_view name = {}) const;
  bool stopped() const { return stop_ != nullptr && stop_->load(); }

  const NameTable& table_;
  const Changes& changes_;
  const bool attributes_;
  const std::vector<TableRoot>& roots_;
  const std::function<void(const TableDifference&)>& told_;
  const std::atomic<bool>* stop_;
  Queue queue_;
  std::vector<FolderStatus> places_;   // the roots
  std::vector<ComparedFolder> below_;  // the folder's that is compared
};

bool Comparison::IsWhole(FolderId folder) const {
  const auto found = changes_.folders().find(folder);
  return found != changes_.folders().end() && found->second.whole;
}

bool Comparison::IsCovered(FolderId folder, std::string_view name) const {
  const auto found = changes_.folders().find(folder);
  return found != changes_.folders().end() &&
         (found->second.whole || found->second.names.contains(name));
}

void Comparison::Tell(Kind kind, const ComparedFolder& folder, std::string_view name) const {
  std::string path(name);
  for (FolderId id = folder.id; table_.parent(id) != NameTable::kNoFolder; id = table_.parent(id)) {
    path = std::string(table_.folder_name(id)) + (path.empty() ? "" : "/") + path;
  }
  told_({kind, folder.tree, std::move(path)});
}

UniqueFd Comparison::Open(const Queue::Task& task) const {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_NONBLOCK;
  const FolderId id = task.folder.id;
  const int root = roots_[task.folder.tree].fd;
  if (table_.parent(id) == NameTable::kNoFolder) return OpenOnSameMount(root, ".", kFlags);
  if (task.parent) {
    return OpenOnSameMount(task.parent->get(), table_.folder_name(id).data(), kFlags);
  }
  std::vector<std::string_view> names;
  for (FolderId step = id; table_.parent(step) != NameTable::kNoFolder;
       step = table_.parent(step)) {
    names.push_back(table_.folder_name(step));
  }
  const UniqueFd place = OpenByNames(root, std::move(names));
  return place ? OpenOnSameMount(place.get(), ".", kFlags) : UniqueFd();
}

bool Comparison::IsSame(const ComparedFolder& folder, int fd) const {
  FolderStatus status;
  return ReadFolderStatus(fd, status) && status.inode == table_.folder_inode(folder.id) &&
         KeyOf(fd).value_or({}) == table_.key(folder.id);
}

void Comparison::CompareFolder(const Queue::Task& task) {
  const ComparedFolder& folder = task.folder;
  UniqueFd fd = Open(task);
  if (!fd && (errno == EMFILE || errno == ENFILE || errno == ENOMEM)) {
    return queue_.Fail(ErrnoError());
  }
  // Where the folder itself is hinted at, another one in its place is found by whoever looks there.
  const FolderId parent = table_.parent(folder.id);
  const bool covered =
      parent != NameTable::kNoFolder && IsCovered(parent, table_.folder_name(folder.id));
  const bool readable = !table_.unreadable(folder.id) || IsWhole(folder.id);
  const bool same = fd && IsSame(folder, fd.get());
  if (!covered && (fd ? !same || !readable : !table_.unreadable(folder.id))) {
    Tell(Kind::kFolder, folder);
  }
  // Of one that could not be read a search believes nothing.
  if (same && !table_.unreadable(folder.id)) CompareEntries(folder, std::move(fd));
}

// Of each name in the folder, sorted.
std::map<std::string, FoundEntry> Comparison::Find(const ComparedFolder& folder, int fd) const {
  std::map<std::string, FoundEntry> all;
  DirectoryReader reader;
  reader.Start(fd);
  for (DirectoryReader::Entry entry; !stopped() && reader.Next(entry);) {
    FoundEntry found{.inode = entry.inode, .type = entry.type, .attributes = {}};
    struct statx status;
    if (statx(fd, entry.name.data(), kStatFlags, STATX_BASIC_STATS | STATX_BTIME, &status) == 0) {
      found.inode = status.stx_ino;
      found.type = IFTODT(status.stx_mode);
      found.attributes = AttributesOf(status);
    }
    all[std::string(entry.name)] = found;
  }
  if (reader.failed() != 0 && !table_.unreadable(folder.id)) Tell(Kind::kFolder, folder);
  return all;
}

void Comparison::CompareEntries(const ComparedFolder& folder, UniqueFd fd) {
  below_.clear();
  EntryId id = table_.entries_begin(folder.id);
  const EntryId end = table_.entries_end(folder.id);
  const auto tell_gone = [&] {
    if (!IsCovered(folder.id, table_.name(id))) Tell(Kind::kGone, folder, table_.name(id));
  };
  for (const auto& [name, found] : Find(folder, fd.get())) {
    for (; id < end && table_.name(id) < name; ++id) tell_gone();
    if (id < end && table_.name(id) == name) {
      CompareEntry(folder, fd.get(), id++, found);
    } else if (!IsCovered(folder.id, name)) {
      Tell(Kind::kMissing, folder, name);
    }
  }
  for (; id < end && !stopped(); ++id) tell_gone();
  queue_.Push(std::move(fd), std::move(below_));
}

// Looks at one entry that both have.
void Comparison::CompareEntry(const ComparedFolder& folder, int fd, EntryId id,
                              const FoundEntry& found) {
  if (!IsInOrder(folder.id, id)) Tell(Kind::kOrder, folder, table_.name(id));
  const FolderId child = table_.folder_at(id);
  const bool covered = IsCovered(folder.id, table_.name(id));
  const bool both_folders = found.type == DT_DIR && table_.type(id) == DT_DIR;
  if (!covered && found.type != table_.type(id)) {
    Tell(Kind::kType, folder, table_.name(id));
  } else if (!covered && both_folders && child == NameTable::kNoFolder) {
    if (IsOfTree(folder, fd, table_.name(id).data())) Tell(Kind::kFolder, folder, table_.name(id));
  } else if (!covered && !HasSameAttributes(id, found)) {
    Tell(Kind::kAttributes, folder, table_.name(id));
  }
  if (!both_folders || child == NameTable::kNoFolder) return;
  // One that is hinted at and is another by now is walked by whoever comes there.
  if (!covered || table_.folder_inode(child) == found.inode) below_.push_back({child, folder.tree});
}

bool Comparison::HasSameAttributes(EntryId id, const FoundEntry& found) const {
  const std::optional<NameTable::Attributes> told = table_.attributes(id);
  if (table_.inode(id) != found.inode) return false;
  if (!told || !attributes_ || changes_.inodes().contains(found.inode)) return true;
  return found.attributes && *told == *found.attributes;
}

// Whether a folder that the table does not have should be in it.
bool Comparison::IsOfTree(const ComparedFolder& folder, int fd, const char* name) const {
  const UniqueFd opened = OpenOnSameMount(fd, name, O_PATH | O_DIRECTORY | O_NOFOLLOW);
  FolderStatus status;
  if (!opened || !ReadFolderStatus(opened.get(), status)) return false;
  for (const FolderStatus& place : places_) {
    if (place.inode == status.inode) return false;
  }
  const FolderStatus& place = places_[folder.tree];
  return status.device == place.device && status.mount == place.mount;
}

bool Comparison::IsInOrder(FolderId folder, EntryId id) const {
  std::string text;
  MakeSearchText(table_.name(id), text);
  text.push_back('\0');
  const FolderId child = table_.folder_at(id);
  const bool linked =
      child == NameTable::kNoFolder ||
      (table_.parent(child) == folder && table_.folder_entry(child) == id &&
       table_.type(id) == DT_DIR && child > folder && child < table_.subtree_end(folder));
  return linked && table_.folder_of(id) == folder && table_.texts(id, id + 1) == text &&
         table_.entry_of_text(table_.text_begin(id)) == id &&
         table_.FindEntry(folder, table_.name(id)) == id;
}

Status Comparison::Run() {
  if (roots_.size() != table_.trees()) return ErrnoError(EINVAL);
  std::vector<ComparedFolder> tops;
  for (size_t tree = 0; tree < roots_.size(); ++tree) {
    tops.push_back({table_.top(tree), tree});
    if (!ReadFolderStatus(roots_[tree].fd, places_.emplace_back())) {
      return ErrnoError(roots_[tree].name);
    }
  }
  queue_.Push(UniqueFd(), std::move(tops));
  return queue_.Run(1, [this](unsigned, const Queue::Take& take) {
    for (Queue::Task task; take(task);) {
      if (stopped()) queue_.Fail(ErrnoError(ECANCELED));
      CompareFolder(task);
    }
  });
}

}  // namespace

Status CompareTable(const NameTable& table, const Changes& changes, bool attributes,
                    const std::vector<TableRoot>& roots,
                    const std::function<void(const TableDifference&)>& told,
                    const std::atomic<bool>* stop) {
  return Comparison(table, changes, attributes, roots, told, stop).Run();
}

}  // namespace nas
