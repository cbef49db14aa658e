#include "nas/index/tree_reader.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "nas/files/beneath.h"
#include "nas/index/folder_reader.h"
#include "nas/index/open_path.h"

namespace nas {
namespace {

// Whether there is no folder of that name: of that its parent's events tell.
bool IsGone(int error) { return error == ENOENT || error == ENOTDIR || error == ELOOP; }

}  // namespace

NameTable::FolderId OldTable::FirstHint(NameTable::FolderId begin, NameTable::FolderId end) const {
  const auto first = hinted.lower_bound(begin);
  return first != hinted.end() && *first < end ? *first : NameTable::kNoFolder;
}

// One thread's part.
class TreeReader::Worker {
 public:
  Worker(TreeReader& reader, NodeArena& arena)
      : reader_(reader), arena_(arena), entries_(arena, reader.classes_) {}

  void Run(const Queue::Take& take) {
    for (Queue::Task task; take(task);) ReadNode(task);
  }

 private:
  void ReadNode(const Queue::Task& task);
  UniqueFd Open(const Queue::Task& task, bool& readable);
  bool LookAt(FolderNode& node, int fd);
  void Keep(FolderNode& node, UniqueFd fd);
  void ReadEntries(FolderNode& node, UniqueFd fd);
  bool MakeChild(FolderNode& node, int fd, ReadEntry& entry);
  NameTable::FolderId KnownChild(const FolderNode& node, int fd, const ReadEntry& entry) const;
  void Mismatch(const FolderNode& node);
  FolderNode* ChildOf(FolderNode& node, std::string_view name);

  const NameTable& old() const { return *reader_.old_.table; }

  TreeReader& reader_;
  NodeArena& arena_;
  FolderReader entries_;
};

UniqueFd TreeReader::Worker::Open(const Queue::Task& task, bool& readable) {
  FolderNode& node = *task.folder;
  if (reader_.stopped()) reader_.queue_.Fail(ErrnoError(ECANCELED));
  UniqueFd reopened;
  if (!task.parent && node.parent != nullptr) {
    reopened = reader_.OpenByPath(*node.parent);
    // It may come back, and nothing be told of what lies in it.
    if (!reopened && IsGone(errno)) errno = ESTALE;
    if (!reopened) return reopened;
  }
  int parent = reader_.roots_[node.tree].fd;
  if (node.parent != nullptr) parent = task.parent ? task.parent->get() : reopened.get();
  constexpr int kFlags = O_DIRECTORY | O_NOFOLLOW;
  UniqueFd fd = OpenOnSameMount(parent, node.name.data(), O_RDONLY | O_NONBLOCK | kFlags);
  readable = static_cast<bool>(fd);
  const bool forbidden = !IsGone(errno) && errno != EXDEV && errno != ESTALE && errno != EMFILE &&
                         errno != ENFILE && errno != ENOMEM;
  if (!fd && forbidden) fd = OpenOnSameMount(parent, node.name.data(), O_PATH | kFlags);
  return fd;
}

void TreeReader::Worker::ReadNode(const Queue::Task& task) {
  FolderNode& node = *task.folder;
  bool readable = false;
  UniqueFd fd = Open(task, readable);
  if (!fd) {
    if (errno == EMFILE || errno == ENFILE || errno == ENOMEM)
      return reader_.queue_.Fail(ErrnoError());
    if (node.parent == nullptr)
      return reader_.queue_.Fail(ErrnoError(reader_.roots_[node.tree].name));
    // One that is there and cannot be had may be had by whoever asks, as once its parent opens.
    node.state = IsGone(errno) ? FolderNode::State::kGone : FolderNode::State::kElsewhere;
    return Mismatch(node);
  }
  node.folder.key = KeyOf(fd.get()).value_or({});
  if (reader_.options_.before_reading) {
    reader_.options_.before_reading(fd.get(), node.folder.key);
  }
  if (!LookAt(node, fd.get())) return Mismatch(node);
  const bool same = node.old != NameTable::kNoFolder && !node.folder.key.empty() &&
                    old().key(node.old) == node.folder.key;
  if (!same) {
    Mismatch(node);
    node.old = NameTable::kNoFolder;
  }
  node.folder.unreadable = !readable;
  node.order = ++reader_.order_;
  if (same && !reader_.old_.hinted.contains(node.old)) return Keep(node, std::move(fd));
  node.state = FolderNode::State::kRead;
  if (readable) ReadEntries(node, std::move(fd));
  ++reader_.folders_;
  if (reader_.options_.progress != nullptr) ++reader_.options_.progress->folders;
}

// Where a kept folder should hold this one and does not, what is kept of it is wrong.
void TreeReader::Worker::Mismatch(const FolderNode& node) {
  if (node.old == NameTable::kNoFolder || node.parent == nullptr) return;
  if (node.parent->state != FolderNode::State::kKept) return;
  const std::lock_guard lock(reader_.mutex_);
  reader_.stale_.insert(node.parent->old);
}

// The folder's own row. False where it is not of this tree.
bool TreeReader::Worker::LookAt(FolderNode& node, int fd) {
  FolderStatus status;
  if (!ReadFolderStatus(fd, status)) {
    node.state = FolderNode::State::kGone;
    return false;
  }
  const RootPlace& place = reader_.places_[node.tree];
  const bool other = status.device != place.device || status.mount != place.mount;
  if (other || (node.parent != nullptr && reader_.IsRoot(status.inode))) {
    node.state = FolderNode::State::kElsewhere;
    return false;
  }
  node.folder.inode = status.inode;
  node.folder.stamp = status.stamp;
  node.facts = entries_.Facts(status);
  node.has_facts = true;
  return true;
}

FolderNode* TreeReader::Worker::ChildOf(FolderNode& node, std::string_view name) {
  FolderNode* child = arena_.MakeNode();
  child->parent = &node;
  child->name = name;
  child->tree = node.tree;
  return child;
}

// Nothing in the folder itself has changed; below it something has, if anywhere.
void TreeReader::Worker::Keep(FolderNode& node, UniqueFd fd) {
  node.state = FolderNode::State::kKept;
  node.folder.stamp = old().stamp(node.old);
  std::vector<FolderNode*> below;
  const NameTable::FolderId end = old().subtree_end(node.old);
  NameTable::FolderId hint = reader_.old_.FirstHint(node.old + 1, end);
  while (hint != NameTable::kNoFolder) {
    while (old().parent(hint) != node.old) hint = old().parent(hint);
    FolderNode* child = ChildOf(node, old().folder_name(hint));
    child->old = hint;
    node.changed.emplace_back(hint, child);
    below.push_back(child);
    hint = reader_.old_.FirstHint(old().subtree_end(hint), end);
  }
  reader_.queue_.Push(std::move(fd), std::move(below));
}

void TreeReader::Worker::ReadEntries(FolderNode& node, UniqueFd fd) {
  const auto stopped = [this] { return reader_.stopped(); };
  std::vector<ReadEntry>& found = entries_.Read(fd.get(), stopped);
  if (entries_.failed() != 0) {
    node.folder.unreadable = true;
    return;
  }
  std::vector<FolderNode*> below;
  for (ReadEntry& entry : found) {
    if (reader_.stopped()) return;
    if (entries_.IsFolder(entry) && MakeChild(node, fd.get(), entry)) {
      below.push_back(entry.child);
    }
  }
  node.count = found.size();
  ReadEntry* kept = arena_.Entries(found.size());
  std::uninitialized_copy(found.begin(), found.end(), kept);
  node.entries = kept;
  reader_.entries_ += found.size();
  reader_.text_bytes_ += entries_.text_bytes();
  if (reader_.options_.progress != nullptr) reader_.options_.progress->entries += found.size();
  reader_.queue_.Push(std::move(fd), std::move(below));
}

// True where the child is to be read.
bool TreeReader::Worker::MakeChild(FolderNode& node, int fd, ReadEntry& entry) {
  entry.child = ChildOf(node, entry.Name());
  entry.child->old = KnownChild(node, fd, entry);
  const NameTable::FolderId known = entry.child->old;
  if (known == NameTable::kNoFolder ||
      reader_.old_.FirstHint(known, old().subtree_end(known)) != NameTable::kNoFolder) {
    return true;
  }
  entry.child->state = FolderNode::State::kKept;
  entry.child->folder = {.inode = old().folder_inode(known),
                         .stamp = old().stamp(known),
                         .unreadable = old().unreadable(known),
                         .key = old().key(known)};
  entries_.LookUp(fd, entry);
  return false;
}

// The folder of the old table that the entry still is.
NameTable::FolderId TreeReader::Worker::KnownChild(const FolderNode& node, int fd,
                                                   const ReadEntry& entry) const {
  if (node.old == NameTable::kNoFolder) return NameTable::kNoFolder;
  const NameTable::EntryId id = old().FindEntry(node.old, entry.Name());
  const NameTable::FolderId known =
      id == old().entries() ? NameTable::kNoFolder : old().folder_at(id);
  // One that could not be read may be readable by now.
  if (known == NameTable::kNoFolder || old().folder_inode(known) != entry.inode ||
      old().unreadable(known)) {
    return NameTable::kNoFolder;
  }
  const Result<FolderKey> key = KeyOf(fd, entry.Name().data());
  return key && !key->empty() && *key == old().key(known) ? known : NameTable::kNoFolder;
}

TreeReader::TreeReader(const std::vector<TableRoot>& roots, const OldTable& old,
                       ClassTable& classes, const ScanOptions& options)
    : roots_(roots), old_(old), classes_(classes), options_(options) {}

TreeReader::~TreeReader() = default;

bool TreeReader::IsRoot(std::uint64_t inode) const {
  return std::any_of(places_.begin(), places_.end(),
                     [inode](const RootPlace& place) { return place.inode == inode; });
}

Status TreeReader::FindRoots() {
  NodeArena& arena = *arenas_.emplace_back(std::make_unique<NodeArena>());
  std::vector<FolderNode*> below;
  for (size_t i = 0; i < roots_.size(); ++i) {
    FolderStatus status;
    if (!ReadFolderStatus(roots_[i].fd, status)) return ErrnoError(roots_[i].name);
    places_.push_back({status.inode, status.device, status.mount});
    FolderNode* top = arena.MakeNode();
    top->name = ".";
    top->tree = static_cast<std::uint16_t>(i);
    if (old_.table != nullptr) top->old = old_.table->top(i);
    tops_.push_back(top);
    below.push_back(top);
  }
  queue_.Push(UniqueFd(), std::move(below));
  return {};
}

Status TreeReader::Read() {
  if (const Status found = FindRoots(); !found) return found;
  const unsigned threads = std::max(1U, options_.threads);
  for (unsigned i = 0; i < threads; ++i) arenas_.push_back(std::make_unique<NodeArena>());
  const Status read = queue_.Run(threads, [this](unsigned number, const Queue::Take& take) {
    Worker(*this, *arenas_[number]).Run(take);
  });
  return stopped() ? ErrnoError(ECANCELED) : read;
}

// The folder of a node by the names that lead to it; nothing where it is not the one any more.
UniqueFd TreeReader::OpenByPath(const FolderNode& node) const {
  std::vector<std::string_view> names;
  for (const FolderNode* step = &node; step->parent != nullptr; step = step->parent) {
    names.push_back(step->name);
  }
  UniqueFd fd = OpenByNames(roots_[node.tree].fd, std::move(names));
  if (fd && KeyOf(fd.get()).value_or({}) != node.folder.key) {
    fd.Reset();
    errno = ENOENT;
  }
  return fd;
}

}  // namespace nas
