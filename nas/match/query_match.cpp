#include "nas/match/query_match.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>

namespace nas {
namespace {

using Kind = QueryNode::Kind;

Answer Known(bool yes) { return yes ? Answer::kYes : Answer::kNo; }

Answer AskContents(const QueryNode& node, const QuerySubject& subject) {
  if (!subject.is_file || node.needle < 0) return Answer::kNo;
  if (subject.found == nullptr) return Answer::kMaybe;
  if ((*subject.found)[static_cast<size_t>(node.needle)]) return Answer::kYes;
  return subject.all_read ? Answer::kNo : Answer::kMaybe;
}

Answer AskText(const QueryNode& node, const QuerySubject& subject) {
  if (subject.texts_in_contents) return AskContents(node, subject);
  if (node.text->of_path()) {
    if (subject.path != nullptr) return Known(node.text->FindsInPath(*subject.path));
    const bool none = subject.folder != nullptr && !node.text->MayFindBelow(*subject.folder);
    return none ? Answer::kNo : Answer::kMaybe;
  }
  return subject.name == nullptr ? Answer::kMaybe : Known(node.text->FindsInName(*subject.name));
}

bool HasExtension(const QueryNode& node, FoldedName& name) {
  const std::string_view folded = name.folded();
  return std::ranges::any_of(node.suffixes, [folded](const std::string& suffix) {
    return folded.size() > suffix.size() && folded.ends_with(suffix);
  });
}

Answer AskType(const FileType& type, const QuerySubject& subject) {
  if (type.folder || subject.is_folder) return Known(type.folder && subject.is_folder);
  if (type.form != 0) {
    if (subject.is_file) return Known(type.form == DT_REG);
    return subject.type == DT_UNKNOWN ? Answer::kMaybe : Known(subject.type == type.form);
  }
  return Known(!type.category || IsInCategory(ExtensionOf(subject.name->folded()), *type.category));
}

Answer AskTypes(const QueryNode& node, const QuerySubject& subject) {
  if (subject.name == nullptr) return Answer::kMaybe;
  Answer most = Known(node.types.empty());
  for (const FileType& type : node.types) most = std::max(most, AskType(type, subject));
  return most;
}

// What lies in a folder that is left out is left out with it; but most often the entry alone is to
// be asked about, as nobody comes to what is in such a folder.
Answer AskExclude(const QueryNode& node, const QuerySubject& subject) {
  const TextTerm& text = *node.text;
  if (subject.folder != nullptr) {
    return text.FindsOnWay(*subject.folder) ? Answer::kNo : Answer::kMaybe;
  }
  if (subject.name == nullptr) return Answer::kMaybe;
  if (subject.path == nullptr) {
    return text.of_path() ? Answer::kMaybe : Known(!text.FindsInName(*subject.name));
  }
  if (subject.whole_way && text.FindsOnWay(*subject.path)) return Answer::kNo;
  return Known(
      !(text.of_path() ? text.FindsInPath(*subject.path) : text.FindsInName(*subject.name)));
}

bool HoldsOne(const QueryNode& node, std::int64_t value) {
  return std::ranges::any_of(node.bounds, [value](const Bounds& b) { return b.Hold(value); });
}

Answer AskDepth(const QueryNode& node, const QuerySubject& subject) {
  const EntryPath* path = subject.path != nullptr ? subject.path : subject.folder;
  return path == nullptr ? Answer::kMaybe : Known(HoldsOne(node, path->depth()));
}

Answer AskEmpty(const QuerySubject& subject) {
  if (!subject.is_folder) return Known(subject.is_file && subject.attributes->size == 0);
  return subject.is_empty_folder == nullptr ? Answer::kMaybe : Known((*subject.is_empty_folder)());
}

// Of what an inode tells; folders have no size of their own.
Answer AskAttributes(const QueryNode& node, const QuerySubject& subject) {
  if (node.kind == Kind::kSize && subject.is_folder) return Answer::kNo;
  if (node.kind == Kind::kExecutable && !subject.is_file) return Answer::kNo;
  if (subject.attributes == nullptr) return Answer::kMaybe;
  const QueryAttributes& file = *subject.attributes;
  switch (node.kind) {
    case Kind::kSize:
      return Known(HoldsOne(node, file.size));
    case Kind::kModified:
      if (!file.modified_known) return Answer::kMaybe;
      return Known(HoldsOne(node, file.modified));
    case Kind::kCreated:
      return Known(file.created != QueryAttributes::kNoTime && HoldsOne(node, file.created));
    case Kind::kOpened:
      if (!file.opened_known) return Answer::kMaybe;
      return Known(HoldsOne(node, file.opened));
    case Kind::kOwner:
      return Known(HoldsOne(node, file.uid));
    case Kind::kGroup:
      return Known(HoldsOne(node, file.gid));
    case Kind::kExecutable: {
      constexpr std::uint32_t kAnybody = S_IXUSR | S_IXGRP | S_IXOTH;
      return Known((file.mode & kAnybody) != 0);
    }
    default:
      return AskEmpty(subject);
  }
}

}  // namespace

bool IsOfAttributes(QueryNode::Kind kind) {
  return kind >= Kind::kSize && kind < Kind::kExclude && kind != Kind::kDepth;
}

Answer Ask(const QueryNode& node, const QuerySubject& subject) {
  switch (node.kind) {
    case Kind::kAll: {
      Answer least = Answer::kYes;
      for (const QueryNode& child : node.children) {
        least = std::min(least, Ask(child, subject));
        if (least == Answer::kNo) break;
      }
      return least;
    }
    case Kind::kAny: {
      Answer most = Answer::kNo;
      for (const QueryNode& child : node.children) {
        most = std::max(most, Ask(child, subject));
        if (most == Answer::kYes) break;
      }
      return most;
    }
    case Kind::kNot: {
      const Answer answer = Ask(node.children.front(), subject);
      return answer == Answer::kMaybe ? answer : Known(answer == Answer::kNo);
    }
    case Kind::kText:
      return AskText(node, subject);
    case Kind::kContent:
      return AskContents(node, subject);
    case Kind::kExtension:
      if (subject.name == nullptr) return Answer::kMaybe;
      return Known(node.suffixes.empty() || HasExtension(node, *subject.name));
    case Kind::kType:
      return AskTypes(node, subject);
    case Kind::kExclude:
      return AskExclude(node, subject);
    case Kind::kIgnored:  // these are seen to on the way
    case Kind::kOneDisk:
    case Kind::kLetters:
      return Answer::kYes;
    case Kind::kDepth:
      return AskDepth(node, subject);
    default:
      return AskAttributes(node, subject);
  }
}

bool AnyLeaf(const QueryNode& node, const std::function<bool(const QueryNode&)>& test) {
  if (node.kind > Kind::kNot) return test(node);
  return std::ranges::any_of(node.children,
                             [&](const QueryNode& child) { return AnyLeaf(child, test); });
}

}  // namespace nas
