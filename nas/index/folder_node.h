#pragma once
// Folders as they were read, before they are numbered: a tree of nodes, each with its entries
// packed end to end. Nodes and entries live in the arena of the thread that made them, and until
// all arenas go.

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <deque>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include "nas/index/name_table.h"
#include "nas/index/table_writer.h"

namespace nas {

struct FolderNode;

struct ReadEntry {
  std::uint64_t inode = 0;
  std::uint64_t size = 0;
  FolderNode* child = nullptr;  // of a folder
  const char* text = nullptr;   // NUL-ended; then the name, where it is another
  std::int32_t mtime = 0;
  std::int32_t crtime = kNoCrtime;
  std::uint16_t row = 0;
  std::uint16_t text_bytes = 0;
  std::uint16_t name_bytes = 0;
  bool named = false;

  std::string_view Text() const { return {text, text_bytes}; }
  std::string_view Name() const {
    return named ? std::string_view(text + text_bytes + 1, name_bytes) : Text();
  }
  EntryFacts Facts() const { return {inode, size, mtime, crtime, row}; }
};

struct FolderNode {
  enum class State : std::uint8_t {
    kWaiting,
    kGone,       // no such folder any more
    kElsewhere,  // not of this tree, or out of reach: an entry without a folder
    kRead,       // `entries` are what it holds
    kKept,       // it holds what the older table says of `old`, but for `changed`
  };

  FolderNode* parent = nullptr;
  std::string_view name;  // NUL-ended; "." of a topmost one
  NameTable::FolderId old = NameTable::kNoFolder;
  std::uint16_t tree = 0;
  State state = State::kWaiting;
  std::uint64_t order = 0;  // which of all folders were looked at later
  EntryFacts facts;         // of the folder itself; not of one that is kept unseen
  bool has_facts = false;
  TableWriter::Folder folder;
  const ReadEntry* entries = nullptr;
  size_t count = 0;
  // Folders in an old one that is kept, by number.
  std::vector<std::pair<NameTable::FolderId, FolderNode*>> changed;
};

class NodeArena {
 public:
  FolderNode* MakeNode() { return &nodes_.emplace_back(); }
  // Memory without alignment, for as long as the arena lives.
  char* Text(size_t bytes) { return static_cast<char*>(Get(bytes, 1)); }
  ReadEntry* Entries(size_t count) {
    return static_cast<ReadEntry*>(Get(count * sizeof(ReadEntry), alignof(ReadEntry)));
  }

 private:
  static constexpr size_t kBlock = 1 << 20;  // little beside what it is made for, and rarely asked

  void* Get(size_t bytes, size_t alignment) {
    used_ = (used_ + alignment - 1) / alignment * alignment;
    if (blocks_.empty() || used_ + bytes > size_) {
      size_ = bytes > kBlock ? bytes : kBlock;
      blocks_.push_back(std::unique_ptr<char[]>(new char[size_]));
      used_ = 0;
    }
    char* at = blocks_.back().get() + used_;
    used_ += bytes;
    return at;
  }

  std::deque<FolderNode> nodes_;
  std::vector<std::unique_ptr<char[]>> blocks_;
  size_t used_ = 0;
  size_t size_ = 0;
};

}  // namespace nas
