#pragma once
// The wildcards of a term of a query: globs (glob.h), with "{a,b}" for one of several texts and "\"
// before what shall stand for itself, over a name or over a path.
//
// In a path "*", "?" and sets stay within one name and "**" is any number of folders. The pattern
// is about whole names up to the path's own end: "src/*.c" is every such file in a folder src,
// wherever that lies; "/src/*.c" only in the topmost; "src/*/" only folders; "src/**" all that is
// below.
//
// Texts and patterns are expected in the form in which they are compared (folded_name.h). Does not
// change once made: any thread may ask. Matching takes at most text length x pattern length steps.

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/glob.h"

namespace nas {

class Wildcards {
 public:
  // Whether `text` holds what could be a wildcard or a brace, and so is read as described here. A
  // text that does not is itself, backslashes and all.
  static bool Speak(std::string_view text);
  // Of a text that does: whether any of them is left that no backslash takes back.
  static bool Remain(std::string_view text);
  // The text that is meant where none remains.
  static std::string Unescaped(std::string_view text);

  // Nothing where the braces stand for more than kMostAlternatives texts, or for more than 64 KiB.
  static constexpr size_t kMostAlternatives = 256;
  static std::optional<Wildcards> Make(std::string_view text, bool of_path);

  // The globs that `text` stands for; none where there are too many.
  static std::vector<std::string> Alternatives(std::string_view text);

  // A path begins with "/", and ends with it where it is a folder's.
  bool Matches(std::string_view text) const;
  // Of wildcards over paths: whether something that lies in the folder of this path may match.
  bool MayMatchBelow(std::string_view folder) const;
  // A text that everything matched holds; may be empty.
  std::string_view Required() const;
  // Of wildcards over paths: a text that is in the path of the folder of everything matched.
  std::string_view RequiredOfFolder() const;
  // Of wildcards over names: texts, one of which everything matched holds; one that is empty says
  // that nothing is known.
  std::vector<std::string> RequiredTexts() const;
  // Of wildcards over names: as of Glob, for all that they stand for.
  std::string Expression(bool alone) const;

 private:
  // One alternative for paths: runs of names with any number of folders between them.
  struct PathGlob {
    bool anchored = false;
    bool folders_only = false;
    std::vector<std::vector<Glob>> runs;
    // An empty name stands for any.
    bool Matches(const std::vector<std::string_view>& names, bool is_folder) const;
  };
  static PathGlob MakePathGlob(std::string_view text);

  std::vector<Glob> globs_;
  std::vector<PathGlob> path_globs_;
};

}  // namespace nas
