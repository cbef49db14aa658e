#include "nas/match/text_window.h"

#include <unistd.h>

#include <algorithm>

#include "nas/match/text_reader.h"

namespace nas {
namespace {

constexpr size_t kPieceBytes = size_t{64} << 10;

// The text that has been read and may still be shown, and the line to be shown.
class Window {
 public:
  Window(std::uint64_t line, size_t before, size_t after)
      : line_(line), most_before_(before), most_after_(after) {}

  // True once it is full.
  bool Take(std::string_view piece) {
    window_.text += piece;
    SeekLine();
    if (line_ > passed_) {
      DropFront(std::min(at_, window_.text.size()));
      return false;
    }
    return window_.text.size() - at_ > most_after_;
  }

  TextWindow Finish() {
    DropFront(at_);
    if (window_.text.size() - at_ > most_after_) {
      size_t end = at_ + most_after_;
      // No character is cut in two.
      while (end > at_ && (static_cast<unsigned char>(window_.text[end]) & 0xC0) == 0x80) --end;
      window_.text.resize(end);
      window_.after = true;
    }
    return std::move(window_);
  }

 private:
  // Moves at_ to the beginning of the line as far as it has been read.
  void SeekLine() {
    while (passed_ < line_) {
      const size_t end = window_.text.find('\n', at_);
      if (end == std::string::npos) {
        at_ = window_.text.size();  // a line of any length is not held
        return;
      }
      at_ = end + 1;
      ++passed_;
    }
  }

  // Leaves whole lines ahead of `at`, as many as may be shown.
  void DropFront(size_t at) {
    if (at <= most_before_) return;
    const size_t line = window_.text.find('\n', at - most_before_ - 1);
    const size_t from = line < at ? line + 1 : at;
    const auto gone = std::string_view(window_.text).substr(0, from);
    window_.first_line += static_cast<std::uint64_t>(std::ranges::count(gone, '\n'));
    window_.text.erase(0, from);
    window_.before = true;
    at_ -= from;
  }

  const std::uint64_t line_;
  const size_t most_before_;
  const size_t most_after_;
  TextWindow window_;
  std::uint64_t passed_ = 1;  // at_ is the beginning of this line
  size_t at_ = 0;
};

}  // namespace

std::optional<TextWindow> TextAround(int fd, std::uint64_t line, size_t before, size_t after) {
  if (lseek(fd, 0, SEEK_SET) != 0) return std::nullopt;
  TextReader reader(kPieceBytes, /*beyond_ascii=*/true);
  reader.Start(fd);
  for (;;) {
    Window window(line, before, after);
    do {
      if (reader.Next(0) != TextReader::Piece::kText) return std::nullopt;
    } while (!window.Take(reader.text()) && !reader.at_end());
    if (!reader.StartGuessed()) return window.Finish();
  }
}

}  // namespace nas
