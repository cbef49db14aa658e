#pragma once
// The language of searches: what people write, and the tree that it becomes. Every way to a search
// (the pattern of a request, the options of a terminal, a form's fields) ends in this tree; the
// criteria of a walk and the looking into contents are made from it. docs/query.md shows it.
//
//   query  = terms separated by spaces, all of which must match
//   term   = either "|" either ... : one of them is enough; binds closer than the space
//   either = ["!"] ( "<" query ">" | prefix ":" value | text )
//   text   = a word, in which wildcards speak (wildcards.h), or "quoted", in which nothing does;
//            with a "/" it is about the path below the folder that is searched, else about the name
//   prefix = ext type size modified created opened owner group depth empty content case regex
//            exclude hidden ignored mounts letters, in any letter case; a value may be quoted, and
//            is a list separated by "," but for texts
//
// The last line of prefixes holds for all of a search: such a term stands by itself, neither left
// out nor beside a "|" nor in a group with others.
//
// Every text is a query but where a value cannot be understood. What could be meant otherwise is
// text as ever: a "<" or ">" where not every group is closed, a prefix that is quoted or unknown, a
// "!" before nothing, a brace without a list. "regex:" that is not quoted takes all that follows,
// up to the last character that is no space.

#include <cstdint>
#include <ctime>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"
#include "nas/match/file_kinds.h"
#include "nas/match/query_values.h"
#include "nas/match/text_term.h"

namespace nas {

struct QueryNode {
  enum class Kind {
    kAll,   // every child; with none it restricts nothing
    kAny,   // one of the children; with none it matches nothing
    kNot,   // not its one child
    kText,  // `text` in the name, or in the path
    kContent,
    kExtension,
    kType,
    kSize,  // from here on `bounds`, one of which has to hold
    kModified,
    kCreated,
    kOpened,
    kOwner,  // numbers of users
    kGroup,
    kDepth,
    kEmpty,       // a file of no bytes, a folder of no entries
    kExecutable,  // a file that somebody may run
    // From here on what holds for all of a search; among the children of the root alone.
    kExclude,  // neither itself nor in a folder that has `text`
    kIgnored,  // ignore files are obeyed
    kOneDisk,  // what is mounted from another file system is not entered
    kLetters,  // says how texts are compared; gone when a query has been parsed
  };
  Kind kind = Kind::kAll;
  std::vector<QueryNode> children = {};
  std::shared_ptr<const TextTerm> text = nullptr;
  std::vector<std::string> suffixes = {};  // of kExtension: folded, each with its dot
  std::vector<FileType> types = {};
  std::vector<Bounds> bounds = {};
  std::string written = {};  // of a term of the query, as it stands there
  int needle = -1;           // where contents are looked into: which of their needles `text` is
};

// The leaves of single criteria, for whoever has a value without a prefix.
// A list separated by ",", ";" or spaces; a leading "." or "*." of each is dropped. An empty one
// restricts nothing.
QueryNode ExtensionNode(std::string_view list);
QueryNode BoundsNode(QueryNode::Kind kind, Bounds bounds);

// Whether the term says where a search goes.
inline bool IsOfWalk(const QueryNode& node) { return node.kind >= QueryNode::Kind::kExclude; }

class Query {
 public:
  // What one query may hold. Names have 255 bytes, so all of it is far more than anyone types.
  static constexpr size_t kMostBytes = size_t{64} << 10;
  static constexpr size_t kDeepestGroup = 32;

  // `now` is what ages count back from. Looks accounts up. Fails with a sentence that names the
  // term in the place of a path: kErrorUnknownUser and kErrorUnknownGroup for an account that does
  // not exist, kErrorIllegal for everything else.
  static Result<Query> Parse(std::string_view text, std::time_t now = std::time(nullptr));

  const QueryNode& root() const { return root_; }
  bool restricts() const { return !root_.children.empty(); }

 private:
  QueryNode root_;
};

}  // namespace nas
