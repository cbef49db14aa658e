#pragma once
// The path of an entry as terms of a query see it, made only when one asks. Belongs to one thread;
// reused for entry after entry.

#include <algorithm>
#include <string>
#include <string_view>

#include "nas/match/folded_name.h"

namespace nas {

class EntryPath {
 public:
  // The folder that is searched: its path in its share ("/photo/2025") and on disk, neither with a
  // final "/", and its path below the share's root, with neither first nor final "/".
  struct Base {
    std::string in_share;
    std::string on_disk;
    std::string below_root;
  };
  void SetBase(Base base) { base_ = std::move(base); }
  // Of the folder that the entries lie in, below the share's root; borrowed.
  void SetFolder(std::string_view below_root) {
    const size_t skipped = base_.below_root.empty() ? 0 : base_.below_root.size() + 1;
    folder_ = below_root.substr(std::min(below_root.size(), skipped));
  }
  // The same below the folder that is searched.
  std::string_view folder() const { return folder_; }
  // `name` is borrowed.
  void SetEntry(std::string_view name, bool is_folder) {
    name_ = name;
    is_folder_ = is_folder;
    made_ = false;
    rooted_ = Rooted::kNone;
  }

  // "/notes/plan.txt", below the folder that is searched; a folder's has a "/" at its end.
  FoldedName& below() {
    Make();
    return below_;
  }
  // The same with the path of that folder before it, in its share or on disk. Only one of the two
  // is held at a time.
  FoldedName& in_share() { return WithRoot(Rooted::kInShare, base_.in_share); }
  FoldedName& on_disk() { return WithRoot(Rooted::kOnDisk, base_.on_disk); }
  const Base& base() const { return base_; }
  // 1 for what lies in that folder itself.
  int depth() const {
    const auto slashes = std::count(folder_.begin(), folder_.end(), '/');
    return folder_.empty() ? 1 : static_cast<int>(slashes) + 2;
  }

 private:
  enum class Rooted { kNone, kInShare, kOnDisk };

  void Make() {
    if (made_) return;
    text_.assign(1, '/');
    text_.append(folder_).append(folder_.empty() ? "" : "/").append(name_);
    if (is_folder_) text_.push_back('/');
    below_.Set(text_);
    made_ = true;
  }
  FoldedName& WithRoot(Rooted which, const std::string& root) {
    Make();
    if (rooted_ == which) return with_root_;
    rooted_ = which;
    root_text_.assign(root).append(text_);
    with_root_.Set(root_text_);
    return with_root_;
  }

  Base base_;
  std::string_view folder_;
  std::string_view name_;
  bool is_folder_ = false;
  bool made_ = false;
  Rooted rooted_ = Rooted::kNone;
  std::string text_;
  std::string root_text_;
  FoldedName below_;
  FoldedName with_root_;
};

}  // namespace nas
