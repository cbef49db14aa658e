#include "nas/match/content_query.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utf8proc.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"

namespace nas {
namespace {

// Fits the second-level cache together with what is searched for.
constexpr size_t kPieceBytes = 256 * 1024;
// Where a NUL makes a file binary.
constexpr size_t kFirstBlockBytes = 32 * 1024;
// A line longer than this is searched in cuts that overlap by kLineOverlap.
constexpr size_t kLongestLine = 128 * 1024;
constexpr size_t kLineOverlap = 4 * 1024;

std::string Decompose(const std::string& text) {
  const std::unique_ptr<utf8proc_uint8_t, void (*)(void*)> form(
      utf8proc_NFD(reinterpret_cast<const utf8proc_uint8_t*>(text.c_str())), std::free);
  return form ? std::string(reinterpret_cast<const char*>(form.get())) : text;
}

}  // namespace

std::optional<ContentQuery::Needle> ContentQuery::MakeNeedle(
    const NamePattern::Alternative& alternative) {
  Needle needle;
  needle.negated = alternative.negated;
  if (alternative.is_literal() && IsAscii(alternative.text)) {
    needle.literal.emplace(alternative.text);
    return needle;
  }
  // A text may be stored composed or decomposed, so both forms of a literal are looked for.
  const std::string composed = ComposeText(alternative.text);
  const auto kind = alternative.is_literal() ? Regex::Kind::kLiteral : Regex::Kind::kContent;
  for (const std::string& form : {composed, Decompose(composed)}) {
    if (form == composed && !needle.expressions.empty()) continue;
    auto expression = Regex::Compile(form, kind);
    if (!expression) return std::nullopt;
    needle.expressions.push_back(std::move(*expression));
  }
  return needle;
}

std::optional<ContentQuery> ContentQuery::From(const NamePattern& pattern) {
  ContentQuery query;
  bool asks_for_something = false;
  for (const NamePattern::Term& term : pattern.terms()) {
    auto& indexes = query.terms_.emplace_back();
    for (const NamePattern::Alternative& alternative : term) {
      if (alternative.glob) return std::nullopt;
      std::optional<Needle> needle = MakeNeedle(alternative);
      if (!needle) return std::nullopt;
      query.has_negated_ |= needle->negated;
      query.by_lines_ |= alternative.regex != nullptr;
      // A decomposed form is at most three times as long as the composed one.
      query.overlap_ =
          std::max(query.overlap_, alternative.text.size() * (needle->literal ? 1 : 3));
      indexes.push_back(query.needles_.size());
      query.needles_.push_back(std::move(*needle));
    }
    asks_for_something |=
        std::ranges::none_of(term, [](const NamePattern::Alternative& a) { return a.negated; });
  }
  if (!asks_for_something) return std::nullopt;
  return query;
}

bool ContentQuery::Needle::Finds(std::string_view text) const {
  if (literal) return literal->Finds(text);
  return std::ranges::any_of(expressions,
                             [text](const auto& expression) { return expression->Finds(text); });
}

ContentScanner::ContentScanner(const ContentQuery& query, const int& stop_flag)
    : query_(query),
      stop_flag_(stop_flag),
      buffer_(std::max(kPieceBytes, 4 * query.overlap_)),
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

ContentScanner::Outcome ContentScanner::Scan(int folder, const char* name) {
  const UniqueFd fd(Open(folder, name));
  if (!fd) return Outcome::kFailed;
  return ScanOpen(fd.get());
}

ContentScanner::Outcome ContentScanner::ScanOpen(int fd) {
  std::fill(found_.begin(), found_.end(), false);
  size_t kept = 0;  // bytes at the front of the buffer carried over from the piece before
  for (bool first = true;; first = false) {
    if (__atomic_load_n(&stop_flag_, __ATOMIC_RELAXED) != 0) return Outcome::kStopped;
    const size_t room = buffer_.size() - kept;
    const ssize_t count = Uninterrupted([&] { return read(fd, buffer_.data() + kept, room); });
    if (count < 0) return Outcome::kFailed;
    const size_t filled = kept + static_cast<size_t>(count);
    if (first && std::memchr(buffer_.data(), 0, std::min(filled, kFirstBlockBytes)) != nullptr) {
      return Outcome::kBinary;
    }
    // A regular file gives less than asked for only at its end.
    const bool at_end = static_cast<size_t>(count) < room;
    const std::string_view all(buffer_.data(), filled);
    size_t searched = filled;
    size_t keep_from = filled - std::min(filled, query_.overlap_);
    if (query_.by_lines_ && !at_end) {
      const size_t line = all.rfind('\n');
      const bool cut = line == std::string_view::npos || filled - line > kLongestLine;
      if (!cut) searched = line + 1;
      keep_from = std::min(cut ? filled - kLineOverlap : searched, keep_from);
    }
    Search(all.substr(0, searched));
    if (Decided(at_end)) {
      return std::ranges::all_of(query_.terms_,
                                 [this](const auto& term) {
                                   return std::ranges::any_of(term, [this](size_t i) {
                                     return found_[i] != query_.needles_[i].negated;
                                   });
                                 })
                 ? Outcome::kMatch
                 : Outcome::kNoMatch;
    }
    kept = filled - keep_from;
    std::memmove(buffer_.data(), buffer_.data() + keep_from, kept);
  }
}

void ContentScanner::Search(std::string_view text) {
  for (size_t i = 0; i < found_.size(); ++i) {
    if (!found_[i] && query_.needles_[i].Finds(text)) found_[i] = true;
  }
}

// Whether reading on can change the answer.
bool ContentScanner::Decided(bool at_end) const {
  if (at_end) return true;
  if (query_.has_negated_) return false;
  return std::ranges::all_of(query_.terms_, [this](const auto& term) {
    return std::ranges::any_of(term, [this](size_t i) { return found_[i]; });
  });
}

}  // namespace nas
