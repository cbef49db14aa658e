#pragma once
// The colours of names on a terminal, as ls has them: by what a file is, then by how its name ends.

#include <sys/types.h>

#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace arbory {

class LsColors {
 public:
  // The text of LS_COLORS; what it does not say is as ls has it. Of colours that are no numbers
  // nothing is taken, so that no text of the environment reaches the terminal as it is.
  explicit LsColors(std::string_view text);

  // The codes ("01;34") for a file of that name and mode, empty for none. A symbolic link is looked
  // at, by `path`, where its colour depends on what it leads to.
  std::string_view Of(std::string_view name, mode_t mode, const char* path) const;
  std::string_view folder() const { return Code("di"); }

 private:
  std::string_view Code(const char* key) const;
  std::string_view OfFolder(mode_t mode) const;
  std::string_view OfLink(const char* path) const;
  std::string_view OfFile(std::string_view name, mode_t mode) const;

  std::map<std::string, std::string, std::less<>> codes_;
  // By their last byte, the latest first: that one holds.
  std::map<char, std::vector<std::pair<std::string, std::string>>> endings_;
};

}  // namespace arbory
