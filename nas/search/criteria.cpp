#include "nas/search/criteria.h"

#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>

#include "nas/base/accounts.h"
#include "nas/base/error.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

// How much it takes to judge by it: a name, a path, an inode, a folder, contents.
int CostOf(const QueryNode& node) {
  enum { kName, kTable, kPath, kInode, kFolder, kContents };
  switch (node.kind) {
    case Kind::kText:
    case Kind::kExclude:
      return node.text->of_path() ? kPath : kName;
    case Kind::kExtension:
    case Kind::kType:
    case Kind::kDepth:
      return kTable;
    case Kind::kEmpty:
      return kFolder;
    case Kind::kContent:
      return kContents;
    default:
      break;
  }
  int cost = IsOfAttributes(node.kind) ? kInode : kName;
  for (const QueryNode& child : node.children) cost = std::max(cost, CostOf(child));
  return cost;
}

bool AsksPath(const QueryNode& leaf) {
  return leaf.kind == Kind::kDepth || IsOfWalk(leaf) ||
         (leaf.kind == Kind::kText && leaf.text->of_path());
}

}  // namespace

Criteria::Criteria(const std::vector<FileSearch::FindComp*>& comps) {
  for (const FileSearch::FindComp* comp : comps) {
    QueryNode node = comp->criterion().node;
    if (node.kind == Kind::kAll) {
      std::ranges::move(node.children, std::back_inserter(root.children));
    } else {
      root.children.push_back(std::move(node));
    }
  }
  std::ranges::stable_sort(root.children, {}, CostOf);
  ask_attributes = AnyLeaf(root, [](const QueryNode& leaf) { return IsOfAttributes(leaf.kind); });
  ask_paths = AnyLeaf(root, AsksPath);
  pruning = Pruning::Of(root);
}

namespace {

// A leaf of bounds: on which side of them the entry lies.
Refusal OutOf(const QueryNode& node, std::int64_t value, Refusal below, Refusal above) {
  return value < node.bounds.front().from ? below : above;
}

Refusal WhyNotLeaf(const QueryNode& node, const QuerySubject& subject) {
  const QueryAttributes none;
  const QueryAttributes& file = subject.attributes != nullptr ? *subject.attributes : none;
  switch (node.kind) {
    case Kind::kContent:
      return Refusal::kContentsAsked;
    case Kind::kExtension:
      return Refusal::kExtension;
    case Kind::kType:
      return Refusal::kKind;
    case Kind::kSize:
      return OutOf(node, file.size, Refusal::kTooSmall, Refusal::kTooLarge);
    case Kind::kModified:
      return OutOf(node, file.modified, Refusal::kModifiedEarlier, Refusal::kModifiedLater);
    case Kind::kCreated:
      return OutOf(node, file.created, Refusal::kCreatedEarlier, Refusal::kCreatedLater);
    case Kind::kOpened:
      return OutOf(node, file.opened, Refusal::kReadEarlier, Refusal::kReadLater);
    case Kind::kOwner:
      return Refusal::kOwner;
    case Kind::kGroup:
      return Refusal::kGroup;
    case Kind::kDepth:
      return Refusal::kDepth;
    case Kind::kEmpty:
      return Refusal::kNotEmpty;
    case Kind::kExecutable:
      return Refusal::kKind;
    case Kind::kExclude:
      return Refusal::kExcluded;
    default:
      return node.text != nullptr && node.text->of_path() ? Refusal::kPath : Refusal::kName;
  }
}

}  // namespace

Refusal WhyNot(const QueryNode& node, const QuerySubject& subject) {
  if (node.kind == Kind::kAll) {
    for (const QueryNode& child : node.children) {
      if (Ask(child, subject) == Answer::kNo) return WhyNot(child, subject);
    }
  }
  const bool is_list = node.kind <= Kind::kNot;
  if (!is_list) return WhyNotLeaf(node, subject);
  const auto is_other = [](const QueryNode& leaf) {
    return leaf.kind != Kind::kText || leaf.text->of_path();
  };
  if (!AnyLeaf(node, is_other)) return Refusal::kName;
  return node.kind == Kind::kNot ? Refusal::kExcluded : Refusal::kNeither;
}

namespace {

using Made = Result<std::unique_ptr<FileSearch::FindComp>>;

Made Make(QueryNode node) { return Made(std::make_unique<NodeComp>(std::move(node))); }

Made MakePattern(const char* text) {
  auto query = Query::Parse(text);
  if (query) return Make(query->root());
  syslog(LOG_NOTICE, "search pattern refused: %s", query.error().path.c_str());
  return query.error();
}

// An empty word restricts nothing.
Made MakeKind(const char* word) {
  QueryNode node{.kind = Kind::kType};
  if (*word == '\0') return Make(std::move(node));
  const auto type = ParseFileType(word);
  if (!type) return Error{kErrorIllegal, EINVAL, word};
  node.types.push_back(*type);
  return Make(std::move(node));
}

Made MakeOwner(const char* name) {
  const auto user = FindAccount(name);
  if (!user) return user.error();
  return Make(BoundsNode(Kind::kOwner, {user->uid, user->uid}));
}

Made MakeGroup(const char* name) {
  const auto group = FindGroup(name);
  if (!group) return group.error();
  return Make(BoundsNode(Kind::kGroup, {group->gid, group->gid}));
}

Made MakeComp(FileSearch::FindFactory::_tag_FIND_FIELD_ field, const char* text) {
  using FileSearch::FindFactory;
  if (text == nullptr) return Error{kErrorIllegal, EINVAL};
  switch (field) {
    case FindFactory::FIND_PATTERN:
      return MakePattern(text);
    case FindFactory::FIND_FILETYPE:
      return MakeKind(text);
    case FindFactory::FIND_EXTENSION:
      return Make(ExtensionNode(text));
    case FindFactory::FIND_OWNER:
      return MakeOwner(text);
    case FindFactory::FIND_GROUP:
      return MakeGroup(text);
  }
  return Error{kErrorIllegal, EINVAL};
}

}  // namespace
}  // namespace nas

namespace FileSearch {
namespace {

Criterion Bound(nas::QueryNode::Kind kind, bool least, std::int64_t value) {
  nas::Bounds bounds;
  (least ? bounds.from : bounds.to) = value;
  return {nas::BoundsNode(kind, bounds)};
}

}  // namespace

FindSizeComp::FindSizeComp(const char* op, long long bytes)
    : at_least_(std::strcmp(op, "greater") == 0), bytes_(bytes) {}

Criterion FindSizeComp::criterion() const {
  return Bound(nas::QueryNode::Kind::kSize, at_least_, bytes_);
}

FindTimeComp::FindTimeComp(const char* op, long seconds)
    : after_(std::strcmp(op, "after") == 0), seconds_(seconds) {}

Criterion FindMTimeComp::criterion() const {
  return Bound(nas::QueryNode::Kind::kModified, after(), seconds());
}

Criterion FindCRTimeComp::criterion() const {
  return Bound(nas::QueryNode::Kind::kCreated, after(), seconds());
}

Criterion FindATimeComp::criterion() const {
  return Bound(nas::QueryNode::Kind::kOpened, after(), seconds());
}

int FindFactory::createFindOp(_tag_FIND_FIELD_ field, const char* arg1, const char* arg2,
                              std::vector<FindComp*>& comps) {
  auto made = nas::MakeComp(field, field == FIND_FILETYPE ? arg1 : arg2);
  if (!made) {
    nas::Report(made.error());
    return 0;
  }
  comps.push_back(made->get());
  made->release();
  return 1;
}

}  // namespace FileSearch
