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
bool IsTame(const std::string& expression) {
  constexpr std::string_view kTame = "^$.?*+|";
  bool repeated = false;
  for (const char byte : expression) {
    const bool repeats = byte == '*' || byte == '+' || byte == '?';
    const bool letter = (byte >= 'a' && byte <= 'z') || byte == ' ';
    if (!letter && kTame.find(byte) == std::string_view::npos) return false;
    if (repeats && repeated) return false;
    repeated |= repeats;
  }
  return true;
}

bool IsTame(const nas::QueryNode& root) {
  return !AnyLeaf(root, [](const nas::QueryNode& leaf) {
    return leaf.text != nullptr && leaf.text->is_regex() && !IsTame(leaf.text->text());
  });
}

bool LooksForNewlines(const nas::QueryNode& root) {
  return AnyLeaf(root, [](const nas::QueryNode& leaf) {
    return leaf.text != nullptr && leaf.text->text().find('\n') != std::string::npos;
  });
}

bool AsksOnlyTexts(const nas::QueryNode& root) {
  return !AnyLeaf(root, [](const nas::QueryNode& leaf) { return leaf.text == nullptr; });
}

}  // namespace

// The pattern, a NUL, the text.
int fuzz::Target(std::string_view text) {
  using Outcome = nas::ContentScanner::Outcome;
  static PaddedFile file;
  const std::string_view written = fuzz::Take(&text, '\0');
  if (text.size() > kMostText || written.size() > kMostText) return fuzz::kUseless;
  const auto parsed = nas::Query::Parse(written);
  if (!parsed || LooksForNewlines(parsed->root()) || !AsksOnlyTexts(parsed->root())) {
    return fuzz::kUsed;
  }
  const auto query = nas::ContentQuery::From(parsed->root(), true);
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
  if (!IsTame(parsed->root())) return fuzz::kUsed;
  // Cut behind every byte where there are few, behind some where there are many.
  constexpr size_t kMostCuts = 24;
  const size_t step = 1 + text.size() / kMostCuts;
  for (size_t cut = 0; cut <= text.size(); cut += step) DEMAND(scan(kPieceBytes - cut) == whole);
  const int stop = 1;
  DEMAND(nas::ContentScanner(*query, stop).Scan(file.folder(), kName) == Outcome::kStopped);
  return fuzz::kUsed;
}
