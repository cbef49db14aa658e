// All lines of a file that hold what is looked for, and those near them. Only what is told is
// looked at line by line, so that a few lines of a long file cost little more than finding them.

#include <unistd.h>

#include <algorithm>
#include <deque>
#include <utility>

#include "nas/match/content_scanner.h"

namespace nas {
namespace {

constexpr size_t npos = std::string_view::npos;

std::uint64_t LinesIn(std::string_view text) {
  return static_cast<std::uint64_t>(std::ranges::count(text, '\n'));
}

}  // namespace

class ContentScanner::LineTeller {
 public:
  LineTeller(const ContentScanner& scanner, const LinesWanted& wanted, const TellLine& tell)
      : scanner_(scanner), wanted_(wanted), tell_(tell), next_(scanner.query_.needles_.size()) {}

  bool told() const { return told_; }
  bool enough() const { return enough_; }

  // Takes whole lines, or a part of a very long one.
  void Take(std::string_view text) {
    std::ranges::fill(next_, std::nullopt);
    for (size_t at = 0; at < text.size() && !enough_;) {
      const size_t match = NextMatch(text, at);
      const bool near = wanted_.before > 0 || after_left_ > 0;
      if (!near && match == npos) return Pass(text.substr(at));
      if (!near) {
        const size_t start = text.substr(0, match).rfind('\n');
        const size_t begin = start == npos || start < at ? at : start + 1;
        Pass(text.substr(at, begin - at));
        at = begin;
      }
      const size_t end = std::min(text.find('\n', at), text.size());
      TakeLine(text.substr(at, end - at), match <= end);
      in_line_ = end == text.size();
      if (!in_line_) ++number_;
      at = end + 1;
    }
  }

 private:
  // Where the first line from `at` on that matches has what matches, or npos.
  size_t NextMatch(std::string_view text, size_t at) {
    size_t first = npos;
    for (size_t i = 0; i < next_.size(); ++i) {
      const ContentQuery::Needle& needle = scanner_.query_.needles_[i];
      if (needle.negated) continue;
      if (!next_[i] || (*next_[i] != npos && *next_[i] < at)) {
        const auto place = needle.Find(text, at);
        next_[i] = place ? place->at : npos;
      }
      first = std::min(first, *next_[i]);
    }
    return first;
  }

  void Pass(std::string_view text) {
    if (text.empty()) return;
    const std::uint64_t ends = LinesIn(text);
    number_ += ends;
    in_line_ = text.back() != '\n';
    if (ends > 0) told_line_ = false;
  }

  void TakeLine(std::string_view line, bool matches) {
    if (!in_line_) told_line_ = false;
    if (told_line_) return;  // the rest of one that was too long
    if (line.ends_with('\r')) line.remove_suffix(1);
    if (matches) {
      for (const auto& [number, text] : std::exchange(before_, {})) Tell(number, text, false);
      Tell(number_, line, true);
      after_left_ = wanted_.after;
    } else if (after_left_ > 0) {
      Tell(number_, line, false);
      --after_left_;
    } else if (wanted_.before > 0) {
      before_.emplace_back(number_, line.substr(0, wanted_.most_bytes + 1));
      if (before_.size() > wanted_.before) before_.pop_front();
    }
  }

  void Tell(std::uint64_t number, std::string_view text, bool matches) {
    if (enough_) return;
    MatchingLine line = scanner_.Marked(text, {}, wanted_.most_bytes, !in_line_);
    line.number = number;
    told_ = told_line_ = true;
    enough_ = !tell_(line, matches);
  }

  const ContentScanner& scanner_;
  const LinesWanted& wanted_;
  const TellLine& tell_;
  std::vector<std::optional<size_t>> next_;  // by needle, in the text that is looked at
  std::deque<std::pair<std::uint64_t, std::string>> before_;
  std::uint64_t number_ = 1;
  size_t after_left_ = 0;
  bool in_line_ = false;    // what comes goes on with a line that was taken in part
  bool told_line_ = false;  // of which something was told
  bool told_ = false;
  bool enough_ = false;
};

void ContentScanner::EachLine(int folder, const char* name, const LinesWanted& wanted,
                              const TellLine& tell) {
  const UniqueFd fd = OpenRegular(folder, name);
  if (!fd) return;
  const bool one = query_.needles_.size() == 1;
  if (!one && (ScanOpen(fd.get(), texts_, nullptr) != Outcome::kMatch ||
               lseek(fd.get(), 0, SEEK_SET) != 0)) {
    return;
  }
  reader_.Start(fd.get());
  bool told = false;
  do {
    LineTeller lines(*this, wanted, tell);
    // Each line in one piece alone.
    EachPiece(Units::kWholeLines, [&](std::string_view text, size_t /*done*/) {
      lines.Take(text);
      return lines.enough();
    });
    told = lines.told();
  } while (!told && reader_.StartGuessed());
}

}  // namespace nas
