#pragma once
// What a person's terminal needs: names that cannot play tricks on it, and a progress line.

#include <chrono>
#include <string>
#include <string_view>

namespace arbory {

// Appends `text` as it may be shown on a terminal: control characters, those that turn the
// direction of writing, and bytes that are no UTF-8 become \xNN; all else stays as it is.
void AppendEscaped(std::string_view text, std::string* out);
std::string Escaped(std::string_view text);

// Writes all of it. False with errno set, or when interrupted half-way.
bool WriteOut(int fd, std::string_view bytes);

// "arbory: SENTENCE" on standard error, escaped: sentences quote names.
void Complain(std::string_view sentence);

// One line on standard error that is drawn over and over. Does nothing where that is no terminal.
class ProgressLine {
 public:
  ProgressLine();
  ~ProgressLine() { Clear(); }
  ProgressLine(const ProgressLine&) = delete;
  ProgressLine& operator=(const ProgressLine&) = delete;

  // Whether a line shown now would be drawn; between two drawings and at first it would not, so
  // that quick work shows none.
  bool Due() const;
  void Show(const std::string& line);
  // Takes the line away, for other output.
  void Clear();

 private:
  using Clock = std::chrono::steady_clock;
  bool enabled_;
  bool shown_ = false;
  Clock::time_point due_;
};

}  // namespace arbory
