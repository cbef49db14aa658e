#pragma once
// The criteria on names, kinds, owners and groups. Those on sizes and times are part of
// platform/filesearch.h, because the module makes them itself.

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/file_kinds.h"
#include "nas/match/name_pattern.h"
#include "nas/search/refusal.h"
#include "platform/filesearch.h"

namespace nas {

class PatternComp : public FileSearch::FindComp {
 public:
  explicit PatternComp(NamePattern pattern) : pattern_(std::move(pattern)) {}
  Needs needs() const override { return Needs::kName; }
  bool match(const FileSearch::WalkEntry& entry) const override;
  Refusal refusal() const override { return Refusal::kName; }
  const NamePattern& pattern() const { return pattern_; }

 private:
  NamePattern pattern_;
};

// Names that end in one of several extensions; none given restricts nothing. Folders have a name
// like files, so they can match.
class ExtensionComp : public FileSearch::FindComp {
 public:
  // A list separated by ",", ";" or spaces; a leading "." or "*." of each is dropped.
  explicit ExtensionComp(std::string_view list);
  Needs needs() const override { return Needs::kName; }
  bool match(const FileSearch::WalkEntry& entry) const override;
  Refusal refusal() const override { return Refusal::kExtension; }

 private:
  std::vector<std::string> suffixes_;  // folded, each with its dot
};

class KindComp : public FileSearch::FindComp {
 public:
  // "file", "dir", "image", "video", "audio", "document", "archive" in any letter case; an empty
  // word restricts nothing. Null for any other.
  static std::unique_ptr<KindComp> Parse(std::string_view word);
  Needs needs() const override { return Needs::kName; }
  bool match(const FileSearch::WalkEntry& entry) const override;
  Refusal refusal() const override { return Refusal::kKind; }

 private:
  KindComp() = default;
  bool any_ = false;
  bool dirs_ = false;
  std::optional<FileCategory> category_;
};

class OwnerComp : public FileSearch::FindComp {
 public:
  explicit OwnerComp(uid_t uid) : uid_(uid) {}
  Needs needs() const override { return Needs::kAttributes; }
  bool match(const FileSearch::WalkEntry& entry) const override;
  Refusal refusal() const override { return Refusal::kOwner; }

 private:
  uid_t uid_;
};

class GroupComp : public FileSearch::FindComp {
 public:
  explicit GroupComp(gid_t gid) : gid_(gid) {}
  Needs needs() const override { return Needs::kAttributes; }
  bool match(const FileSearch::WalkEntry& entry) const override;
  Refusal refusal() const override { return Refusal::kGroup; }

 private:
  gid_t gid_;
};

}  // namespace nas
