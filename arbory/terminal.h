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

// Writes to standard output what a command has to tell. Throws where that takes it not; a reader
// that has seen enough, such as head, is no failure, and who was interrupted looks for that.
void Print(std::string_view text);

// What Print() throws, for an errno's value.
std::string CannotPrint(int error_number);

// Opens standard descriptors that the program was started without, so that no file of its own gets
// their numbers and with them what is printed: what is read from them or written to them fails.
void FillStandardDescriptors();

// "arbory: SENTENCE" on standard error, escaped: sentences quote names.
void Complain(std::string_view sentence);

// Whether a terminal does what control sequences say, such as to colour; a "dumb" one prints them.
bool KnowsControls();

// One line on standard error that is drawn over and over. Does nothing where that is no terminal,
// or one that only prints.
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
