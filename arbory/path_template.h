#pragma once
// A text with places for a path and its parts, as fd has them: {} the path, {/} the name, {//} the
// folder, {.} the path and {/.} the name without what follows the last dot; {{ and }} are braces.
// Does not change once made.

#include <string>
#include <string_view>
#include <vector>

namespace arbory {

class PathTemplate {
 public:
  explicit PathTemplate(std::string_view text);

  // Whether there is a place in it.
  bool has_places() const { return has_places_; }
  // Appends the text for `path`, which has no "/" at its end.
  void Append(std::string_view path, std::string* out) const;
  std::string Of(std::string_view path) const;

 private:
  enum class Kind { kText, kPath, kName, kFolder, kPathStem, kNameStem };
  struct Piece {
    Kind kind;
    std::string text;  // of kText
  };
  void AddText(char c);

  std::vector<Piece> pieces_;
  bool has_places_ = false;
};

}  // namespace arbory
