#include "nas/index/moved_folders.h"

#include <string_view>
#include <unordered_map>
#include <utility>

namespace nas {
namespace {

using FolderId = NameTable::FolderId;

bool IsFolder(const FolderNode& node) {
  return node.state == FolderNode::State::kRead || node.state == FolderNode::State::kKept;
}

// All nodes in folders that will be in the table, those nearer to the top first.
template <typename Visit>
void ForEachNode(const std::vector<FolderNode*>& tops, const Visit& visit) {
  std::vector<FolderNode*> level = tops;
  std::vector<FolderNode*> next;
  for (; !level.empty(); level.swap(next), next.clear()) {
    for (FolderNode* node : level) {
      if (!visit(*node)) return;
      if (!IsFolder(*node)) continue;
      for (size_t i = 0; i < node->count; ++i) {
        if (node->entries[i].child != nullptr) next.push_back(node->entries[i].child);
      }
      for (const auto& [old, child] : node->changed) next.push_back(child);
    }
  }
}

// False where one was dropped below which nodes have been seen already.
bool DropOnce(const std::vector<FolderNode*>& tops) {
  std::unordered_map<std::string_view, FolderNode*> seen;
  bool done = true;
  ForEachNode(tops, [&](FolderNode& node) {
    if (!IsFolder(node) || node.folder.key.empty()) return true;
    const auto [place, fresh] = seen.try_emplace(node.folder.key, &node);
    if (fresh) return true;
    if (place->second->order <= node.order) {
      place->second->state = FolderNode::State::kElsewhere;
      return done = false;
    }
    node.state = FolderNode::State::kElsewhere;
    return true;
  });
  return done;
}

// Whether the new table takes the folder from the old one as it is: the nearest node around it is
// kept, so that all below that has no node of its own is.
bool IsKept(FolderId id, const NameTable& old,
            const std::unordered_map<FolderId, const FolderNode*>& nodes) {
  for (; id != NameTable::kNoFolder; id = old.parent(id)) {
    const auto node = nodes.find(id);
    if (node != nodes.end()) return node->second->state == FolderNode::State::kKept;
  }
  return false;
}

// Those of a folder that the new table takes from another place of the old one, each with its
// number there.
std::vector<std::pair<FolderNode*, FolderId>> NodesOfKept(const std::vector<FolderNode*>& tops,
                                                          const NameTable& old) {
  std::unordered_map<FolderId, const FolderNode*> nodes;
  ForEachNode(tops, [&](const FolderNode& node) {
    if (node.old != NameTable::kNoFolder) nodes[node.old] = &node;
    // Also where it turned out to be another.
    nodes.insert(node.changed.begin(), node.changed.end());
    return true;
  });
  std::vector<std::pair<FolderNode*, FolderId>> found;
  ForEachNode(tops, [&](FolderNode& node) {
    if (!IsFolder(node) || node.old != NameTable::kNoFolder || node.folder.key.empty()) return true;
    const FolderId id = old.Find(node.folder.key);
    if (id == NameTable::kNoFolder || nodes.contains(id)) return true;
    if (old.parent(id) != NameTable::kNoFolder && IsKept(id, old, nodes)) {
      found.emplace_back(&node, id);
    }
    return true;
  });
  return found;
}

}  // namespace

void DropMovedFolders(const std::vector<FolderNode*>& tops, const NameTable* old) {
  // A folder is met before those in it, so what is below a dropped one is never compared again.
  while (!DropOnce(tops)) {
  }
  if (old == nullptr) return;
  for (const auto& [node, id] : NodesOfKept(tops, *old)) {
    node->state = FolderNode::State::kElsewhere;
  }
}

std::set<FolderId> FoldersLeft(const std::vector<FolderNode*>& tops, const NameTable& old) {
  std::set<FolderId> left;
  for (const auto& [node, id] : NodesOfKept(tops, old)) left.insert(old.parent(id));
  return left;
}

}  // namespace nas
