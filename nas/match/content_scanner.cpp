#include "nas/match/content_scanner.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"

namespace nas {
namespace {

// Fits the second-level cache together with what is searched for.
constexpr size_t kPieceBytes = 256 * 1024;
// A line longer than this is searched in cuts that overlap by kLineOverlap.
constexpr size_t kLongestLine = 128 * 1024;
constexpr size_t kLineOverlap = 4 * 1024;

constexpr std::string_view kEllipsis = "…";
constexpr size_t npos = std::string_view::npos;

bool IsContinuation(char byte) { return (static_cast<unsigned char>(byte) & 0xC0) == 0x80; }

// Marks in order, those that overlap as one.
void Merge(std::vector<std::pair<size_t, size_t>>* marks) {
  std::ranges::sort(*marks);
  std::vector<std::pair<size_t, size_t>> merged;
  for (const auto& [at, length] : *marks) {
    if (!merged.empty() && at <= merged.back().first + merged.back().second) {
      auto& last = merged.back();
      last.second = std::max(last.second, at + length - last.first);
    } else {
      merged.emplace_back(at, length);
    }
  }
  marks->swap(merged);
}

// Keeps `most` bytes around the first mark, or the first ones; `whole_before`: nothing was left out
// before.
MatchingLine Cut(std::string_view line, std::vector<std::pair<size_t, size_t>> marks, size_t most,
                 bool whole_before) {
  constexpr size_t kShareBefore = 4;
  size_t from = 0;
  size_t end = line.size();
  if (line.size() > most) {
    const size_t before = most / kShareBefore;
    const size_t first = marks.empty() ? 0 : marks[0].first;
    from = first > before ? first - before : 0;
    end = std::min(line.size(), from + most);
    while (from < first && IsContinuation(line[from])) ++from;
    while (end > first && end < line.size() && IsContinuation(line[end])) --end;
  }
  MatchingLine found;
  if (from > 0 || !whole_before) found.text = kEllipsis;
  const size_t shift = found.text.size();
  found.text += line.substr(from, end - from);
  if (end < line.size()) found.text += kEllipsis;
  for (const auto& [at, length] : marks) {
    if (at < from || at >= end) continue;
    found.marks.emplace_back(at - from + shift, std::min(length, end - at));
  }
  return found;
}

}  // namespace

ContentScanner::ContentScanner(const ContentQuery& query, const int& stop_flag)
    : query_(query),
      stop_flag_(stop_flag),
      texts_(
          [&query](const auto& found, bool all_read) { return query.AskTexts(found, all_read); }),
      reader_(std::max(kPieceBytes, 4 * query.overlap_), query.beyond_ascii_),
      found_(query.needles_.size()) {}

// Reading must not change the access time, which is itself a criterion; only a file's owner may
// ask for that.
int ContentScanner::Open(int folder, const char* name) {
  constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY;
  if (keep_access_time_) {
    const int fd = openat(folder, name, kFlags | O_NOATIME);
    if (fd >= 0 || errno != EPERM) return fd;
    keep_access_time_ = false;
  }
  return openat(folder, name, kFlags);
}

ContentScanner::Outcome ContentScanner::Scan(int folder, const char* name, const Decide& decide) {
  const UniqueFd fd(Open(folder, name));
  return fd ? ScanOpen(fd.get(), decide, nullptr) : Outcome::kFailed;
}

ContentScanner::Outcome ContentScanner::ScanOpen(int fd, const Decide& decide, LineSearch* lines) {
  std::fill(found_.begin(), found_.end(), false);
  reader_.Start(fd);
  Outcome outcome = Read(decide, lines);
  // What stands there in either reading is there: the guess may be wrong.
  const bool open = outcome == Outcome::kNoMatch && decide(found_, false) == Answer::kMaybe;
  if (open && reader_.StartGuessed()) outcome = Read(decide, lines);
  const bool told = outcome == Outcome::kNoMatch || outcome == Outcome::kBinary;
  return told && decide(found_, true) == Answer::kYes ? Outcome::kMatch : outcome;
}

// kNoMatch for a file that was read as far as is needed to tell.
ContentScanner::Outcome ContentScanner::Read(const Decide& decide, LineSearch* lines) {
  if (lines != nullptr) {
    lines->lines_before = 0;
    lines->at_line_start = true;
  }
  const bool by_lines = query_.by_lines_ || lines != nullptr;
  return EachPiece(by_lines ? Units::kLines : Units::kBytes,
                   [&](std::string_view text, size_t done) {
                     if (lines != nullptr && !lines->line) {
                       SearchLine(text, done, *lines);
                     } else {
                       Search(text);
                     }
                     return decide(found_, false) != Answer::kMaybe;
                   });
}

ContentScanner::Outcome ContentScanner::EachPiece(Units units, const Look& look) {
  for (size_t keep = 0;;) {
    if (__atomic_load_n(&stop_flag_, __ATOMIC_RELAXED) != 0) return Outcome::kStopped;
    switch (reader_.Next(keep)) {
      case TextReader::Piece::kText:
        break;
      case TextReader::Piece::kBinary:
        return Outcome::kBinary;
      case TextReader::Piece::kFailed:
        return Outcome::kFailed;
    }
    const std::string_view all = reader_.text();
    if (bytes_ != nullptr) bytes_->fetch_add(all.size() - keep, std::memory_order_relaxed);
    size_t searched = all.size();
    size_t keep_from = all.size() - std::min(all.size(), query_.overlap_);
    if (units != Units::kBytes && !reader_.at_end()) {
      const size_t line = all.rfind('\n') + 1;  // begins there; npos + 1 is 0
      const bool short_first = units == Units::kWholeLines && line == 0;
      const bool cut = (line == 0 && !short_first) || all.size() - line > kLongestLine;
      if (!cut) searched = line;
      const size_t overlap = std::min(all.size(), kLineOverlap);
      keep_from = std::min(cut ? all.size() - overlap : searched, keep_from);
      if (units == Units::kWholeLines) keep_from = searched;
    }
    if (look(all.substr(0, searched), keep_from) || reader_.at_end()) return Outcome::kNoMatch;
    keep = all.size() - keep_from;
  }
}

void ContentScanner::Search(std::string_view text) {
  for (size_t i = 0; i < found_.size(); ++i) {
    if (!found_[i] && query_.needles_[i].Finds(text)) found_[i] = true;
  }
}

// Opening something else, such as a device, may have effects.
UniqueFd ContentScanner::OpenRegular(int folder, const char* name) {
  struct stat info;
  const bool regular =
      fstatat(folder, name, &info, AT_SYMLINK_NOFOLLOW) == 0 && S_ISREG(info.st_mode);
  return UniqueFd(regular ? Open(folder, name) : -1);
}

std::optional<MatchingLine> ContentScanner::FirstLine(int folder, const char* name,
                                                      size_t most_bytes) {
  const UniqueFd fd = OpenRegular(folder, name);
  return fd ? FirstLine(fd.get(), most_bytes) : std::nullopt;
}

std::optional<MatchingLine> ContentScanner::FirstLine(int fd, size_t most_bytes) {
  LineSearch lines{.most_bytes = most_bytes};
  if (ScanOpen(fd, texts_, &lines) != Outcome::kMatch) return std::nullopt;
  return std::move(lines.line);
}

void ContentScanner::SearchLine(std::string_view text, size_t done, LineSearch& lines) {
  TextPlace first{npos, 0};
  for (size_t i = 0; i < found_.size(); ++i) {
    const ContentQuery::Needle& needle = query_.needles_[i];
    if (found_[i] && needle.negated) continue;
    const auto place = needle.Find(text, 0);
    if (!place) continue;
    found_[i] = true;
    if (!needle.negated && place->at < first.at) first = *place;
  }
  if (first.at != npos) {
    lines.line = LineAt(first, text, lines);
    return;
  }
  const std::string_view gone = text.substr(0, done);
  lines.lines_before += static_cast<std::uint64_t>(std::ranges::count(gone, '\n'));
  if (!gone.empty()) lines.at_line_start = gone.back() == '\n';
}

// The line that `first` lies in, with all that it has of the needles.
MatchingLine ContentScanner::LineAt(TextPlace first, std::string_view text,
                                    const LineSearch& lines) const {
  const size_t before = first.at == 0 ? npos : text.rfind('\n', first.at - 1);
  const size_t from = before == npos ? 0 : before + 1;
  size_t end = std::min(text.find('\n', first.at), text.size());
  if (end > from && text[end - 1] == '\r') --end;
  const std::string_view line = text.substr(from, std::max(end, first.at) - from);
  MatchingLine found =
      Marked(line, {{first.at - from, std::min(first.length, line.size() - (first.at - from))}},
             lines.most_bytes, before != npos || lines.at_line_start);
  found.number = lines.lines_before + 1 +
                 static_cast<std::uint64_t>(std::ranges::count(text.substr(0, from), '\n'));
  return found;
}

MatchingLine ContentScanner::Marked(std::string_view line,
                                    std::vector<std::pair<size_t, size_t>> marks, size_t most_bytes,
                                    bool whole_before) const {
  for (const auto& needle : query_.needles_) {
    if (needle.negated) continue;
    size_t at = 0;
    for (auto place = needle.Find(line, at); place; place = needle.Find(line, at)) {
      if (place->at < at || place->length == 0) break;  // of an expression that marks nothing
      marks.emplace_back(place->at, place->length);
      at = place->at + place->length;
    }
  }
  Merge(&marks);
  return Cut(line, std::move(marks), most_bytes, whole_before);
}

}  // namespace nas
