#include "arbory/terminal.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

#include "arbory/interrupt.h"
#include "nas/base/hex.h"
#include "nas/base/utf8.h"

namespace arbory {
namespace {

// Work shorter than this needs no progress; the line then changes often enough to look alive.
constexpr std::chrono::milliseconds kFirstLine{300};
constexpr std::chrono::milliseconds kNextLine{100};
constexpr size_t kUsualColumns = 80;
constexpr char kClearLine[] = "\r\x1b[K";

// Whether a valid sequence of several bytes is a C1 control (U+0080 to U+009F), a line separator
// or a mark that turns the direction of writing (U+200E/F, U+2028 to U+202E, U+2066 to U+2069).
bool IsTrick(std::string_view sequence) {
  const auto byte = [&](size_t at) { return static_cast<unsigned char>(sequence[at]); };
  if (sequence.size() == 2) return byte(0) == 0xC2 && byte(1) < 0xA0;
  if (sequence.size() != 3 || byte(0) != 0xE2) return false;
  if (byte(1) == 0x80) {
    return byte(2) == 0x8E || byte(2) == 0x8F || (byte(2) >= 0xA8 && byte(2) <= 0xAE);
  }
  return byte(1) == 0x81 && byte(2) >= 0xA6 && byte(2) <= 0xA9;
}

// As many whole characters as fit into that many bytes.
std::string_view Cut(std::string_view line, size_t bytes) {
  size_t end = 0;
  while (end < line.size()) {
    const size_t next = end + nas::NextUtf8(line.substr(end)).length;
    if (next > bytes) break;
    end = next;
  }
  return line.substr(0, end);
}

}  // namespace

void AppendEscaped(std::string_view text, std::string* out) {
  while (!text.empty()) {
    const nas::Utf8Step step = nas::NextUtf8(text);
    const std::string_view sequence = text.substr(0, step.length);
    text.remove_prefix(step.length);
    const bool bad = step.length == 1 ? nas::IsControl(static_cast<unsigned char>(sequence.front()))
                                      : IsTrick(sequence);
    if (step.valid && !bad) {
      *out += sequence;
      continue;
    }
    for (const unsigned char byte : sequence) {
      *out += "\\x";
      nas::AppendHex(byte, nas::kUpperHex, out);
    }
  }
}

std::string Escaped(std::string_view text) {
  std::string out;
  AppendEscaped(text, &out);
  return out;
}

bool WriteOut(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = write(fd, bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR && !Interrupted()) continue;
    if (written < 0) return false;
    bytes.remove_prefix(static_cast<size_t>(written));
  }
  return true;
}

void Print(std::string_view text) {
  if (WriteOut(STDOUT_FILENO, text) || Interrupted() || errno == EPIPE) return;
  throw std::runtime_error(CannotPrint(errno));
}

std::string CannotPrint(int error_number) {
  return std::string("cannot write to standard output: ") + std::strerror(error_number);
}

void FillStandardDescriptors() {
  for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (fcntl(fd, F_GETFD) >= 0) continue;
    // The lowest that is free is this one.
    open("/dev/null", (fd == STDIN_FILENO ? O_WRONLY : O_RDONLY) | O_CLOEXEC);
  }
}

void Complain(std::string_view sentence) {
  WriteOut(STDERR_FILENO, "arbory: " + Escaped(sentence) + "\n");
}

bool KnowsControls() {
  const char* const kind = getenv("TERM");
  return kind == nullptr || std::string_view(kind) != "dumb";
}

ProgressLine::ProgressLine()
    : enabled_(isatty(STDERR_FILENO) != 0 && KnowsControls()), due_(Clock::now() + kFirstLine) {}

bool ProgressLine::Due() const { return enabled_ && Clock::now() >= due_; }

void ProgressLine::Show(const std::string& line) {
  if (!Due()) return;
  winsize size = {};
  const bool known = ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
  // A line that reaches the last column would wrap on some terminals and then not be cleared.
  const size_t room = (known ? size.ws_col : kUsualColumns) - 1;
  WriteOut(STDERR_FILENO, kClearLine + std::string(Cut(line, room)));
  shown_ = true;
  due_ = Clock::now() + kNextLine;
}

void ProgressLine::Clear() {
  if (shown_) WriteOut(STDERR_FILENO, kClearLine);
  shown_ = false;
}

}  // namespace arbory
