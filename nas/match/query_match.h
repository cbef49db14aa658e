#pragma once
// What a query says of one entry, as far as the entry is known. Asked again once more is known, the
// answer only becomes surer. Any thread may ask, with a subject of its own.

#include <cstdint>
#include <functional>
#include <vector>

#include "nas/match/entry_path.h"
#include "nas/match/folded_name.h"
#include "nas/match/query.h"

namespace nas {

enum class Answer : unsigned char { kNo, kMaybe, kYes };  // in this order

// What stands in an inode and is asked for.
struct QueryAttributes {
  static constexpr std::int64_t kNoTime = INT64_MIN;
  std::int64_t size = 0;
  std::int64_t modified = 0;
  bool modified_known = true;
  std::int64_t created = kNoTime;  // kNoTime: not recorded, and so never within bounds
  std::int64_t opened = 0;
  bool opened_known = true;
  std::uint32_t mode = 0;
  std::uint32_t uid = 0;
  std::uint32_t gid = 0;
};

// Everything is borrowed. What is null is not known yet: whatever asks of it answers "maybe".
struct QuerySubject {
  FoldedName* name = nullptr;
  EntryPath* path = nullptr;
  // In the place of an entry's path: that of the folder it lies in, as of an entry without a name.
  // Then it is asked whether there may be a match in it.
  EntryPath* folder = nullptr;
  bool is_folder = false;
  bool is_file = false;    // a regular one, which alone has contents
  unsigned char type = 0;  // DT_*; 0 is not known but for the two
  // Whether folders on the way to the entry have not been asked about before.
  bool whole_way = false;
  const QueryAttributes* attributes = nullptr;
  const std::function<bool()>* is_empty_folder = nullptr;

  // Whether texts are looked for in contents instead of names, and which needles of them have been
  // found so far. Null: nothing has been read.
  bool texts_in_contents = false;
  const std::vector<bool>* found = nullptr;
  bool all_read = false;
};

Answer Ask(const QueryNode& node, const QuerySubject& subject);

// Whether the tree has a leaf of which `test` says so.
bool AnyLeaf(const QueryNode& node, const std::function<bool(const QueryNode&)>& test);
bool IsOfAttributes(QueryNode::Kind kind);

}  // namespace nas
