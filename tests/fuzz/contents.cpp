// A query over the bytes of a file: where the file is cut into pieces must not change the answer.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

#include "nas/base/unique_fd.h"
#include "nas/match/content_scanner.h"
#include "tests/fuzz/fuzz.h"

namespace {

// As the scanner reads. Another size would only make this target blind, not wrong.
constexpr size_t kPieceBytes = 256 * 1024;
constexpr size_t kMostText = 2048;
constexpr char kName[] = "file";

// A file that is a run of empty lines and then the text.
class PaddedFile {
 public:
  PaddedFile() : folder_(open(fuzz::Scratch().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC)) {
    fuzz::WriteFile(fuzz::Scratch() + "/" + kName, std::string(kPieceBytes, '\n'));
    file_ = nas::UniqueFd(openat(folder_.get(), kName, O_WRONLY | O_CLOEXEC));
  }

  int folder() const { return folder_.get(); }
  void Put(size_t at, std::string_view text) {
    DEMAND(pwrite(file_.get(), text.data(), text.size(), static_cast<off_t>(at)) ==
           static_cast<ssize_t>(text.size()));
    DEMAND(ftruncate(file_.get(), static_cast<off_t>(at + text.size())) == 0);
  }
  void TakeAway(size_t at, size_t count) { Put(at, std::string(count, '\n')); }

 private:
  nas::UniqueFd folder_;
  nas::UniqueFd file_;
};

// Whether an expression's matches lie within a line, so that cutting between lines cannot change
// them, and cost little, so that no length makes the library give up.
bool IsTame(std::string_view pattern) {
  constexpr std::string_view kTame = "abcdefghijklmnopqrstuvwxyz: ^$.?*+|";
  if (pattern.find("regex:") == std::string_view::npos) return true;
  const auto repeats = [](char byte) { return byte == '*' || byte == '+' || byte == '?'; };
  return pattern.find_first_not_of(kTame) == std::string_view::npos &&
         std::ranges::count_if(pattern, repeats) <= 1;
}

}  // namespace

// The pattern, a NUL, the text.
int fuzz::Target(std::string_view text) {
  using Outcome = nas::ContentScanner::Outcome;
  static PaddedFile file;
  const std::string_view written = fuzz::Take(&text, '\0');
  if (text.size() > kMostText || written.size() > kMostText) return fuzz::kUseless;
  // One that looks for a line's end finds those that the file is filled with.
  const auto pattern = nas::NamePattern::Parse(written);
  if (!pattern || written.find('\n') != std::string_view::npos) return fuzz::kUsed;
  const auto query = nas::ContentQuery::From(*pattern);
  if (!query) return fuzz::kUsed;

  const int go_on = 0;
  nas::ContentScanner scanner(*query, go_on);
  const auto scan = [&](size_t at) {
    file.Put(at, text);
    const Outcome outcome = scanner.Scan(file.folder(), kName);
    file.TakeAway(at, text.size());
    return outcome;
  };
  // Far enough from the front that a NUL does not make it binary, and whole in the first piece.
  const Outcome whole = scan(kPieceBytes / 2);
  DEMAND(whole == Outcome::kMatch || whole == Outcome::kNoMatch);
  if (!IsTame(written)) return fuzz::kUsed;
  // Cut behind every byte where there are few, behind some where there are many.
  constexpr size_t kMostCuts = 24;
  const size_t step = 1 + text.size() / kMostCuts;
  for (size_t cut = 0; cut <= text.size(); cut += step) DEMAND(scan(kPieceBytes - cut) == whole);
  const int stop = 1;
  DEMAND(nas::ContentScanner(*query, stop).Scan(file.folder(), kName) == Outcome::kStopped);
  return fuzz::kUsed;
}
