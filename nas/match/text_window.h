#pragma once
// A part of a text file for a person to read, in UTF-8 whatever it is written in.

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace nas {

struct TextWindow {
  std::uint64_t first_line = 1;  // the number of the line that `text` begins with
  std::string text;              // whole lines at its beginning, cut anywhere at its end
  bool before = false;           // there is more
  bool after = false;
};

// What lies around the line of this number, from 1: up to `before` bytes ahead of it, and `after`
// from its beginning; the file's end where it has fewer lines. Nothing where the file, open at `fd`
// and seekable, is no text or cannot be read. Reads up to there, twice where a first reading shows
// that the file is in another encoding than UTF-8.
std::optional<TextWindow> TextAround(int fd, std::uint64_t line, size_t before, size_t after);

}  // namespace nas
