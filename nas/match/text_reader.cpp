#include "nas/match/text_reader.h"

#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>

#include "nas/base/system_call.h"

namespace nas {
namespace {

// Where a NUL makes a file binary: read alone at first, as most large files are binary.
constexpr size_t kFirstBlockBytes = 32 * 1024;
// Of that, what is read before all else: nearly every binary format has a NUL near its beginning,
// and reading the whole block takes longer than opening the file.
constexpr size_t kHeadBytes = 4 * 1024;
// What an encoding is guessed from, most of it behind the first foreign byte.
constexpr size_t kSampleBytes = 64 * 1024;
constexpr std::uint64_t kSampleBefore = 4 * 1024;

}  // namespace

TextReader::TextReader(size_t piece_bytes, bool beyond_ascii)
    : beyond_ascii_(beyond_ascii), buffer_(std::max(piece_bytes, kFirstBlockBytes)) {}

void TextReader::Start(int fd) {
  fd_ = fd;
  foreign_.reset();
  Begin(std::nullopt);
}

void TextReader::Begin(std::optional<TextDecoder> decoder) {
  decoder_.reset();
  if (decoder) decoder_.emplace(std::move(*decoder));
  filled_ = 0;
  first_ = true;
  at_end_ = false;
  offset_ = 0;
  cut_ = 0;
}

bool TextReader::StartGuessed() {
  if (!foreign_) return false;
  const std::uint64_t from = *foreign_ - std::min(*foreign_, kSampleBefore);
  encoded_.resize(std::max(encoded_.size(), kSampleBytes));
  const ssize_t count = Uninterrupted(
      [&] { return pread(fd_, encoded_.data(), kSampleBytes, static_cast<off_t>(from)); });
  foreign_.reset();
  if (count <= 0) return false;
  const std::string encoding = GuessEncoding({encoded_.data(), static_cast<size_t>(count)});
  if (encoding.empty()) return false;
  auto decoder = TextDecoder::For(encoding);
  if (!decoder || lseek(fd_, 0, SEEK_SET) != 0) return false;
  Begin(std::move(decoder));
  return true;
}

TextReader::Piece TextReader::Next(size_t keep) {
  const size_t kept = std::max(keep, cut_);
  std::memmove(buffer_.data(), buffer_.data() + filled_ - kept, kept);
  const auto added = first_     ? ReadFirst()
                     : decoder_ ? ReadDecoded(kept)
                                : ReadPlain(kept, buffer_.size());
  if (!added) return Piece::kFailed;
  filled_ = kept + *added;
  const std::string_view beginning = text().substr(0, kFirstBlockBytes);
  if (std::exchange(first_, false) && beginning.find('\0') != std::string_view::npos) {
    return Piece::kBinary;
  }
  if (beyond_ascii_ && !decoder_ && !foreign_) LookForForeign(kept);
  return Piece::kText;
}

// A mark is no part of the text; that of UTF-16 also says how to read it.
std::optional<size_t> TextReader::ReadFirst() {
  if (decoder_) return ReadDecoded(0);
  const auto count = ReadPlain(0, kHeadBytes);
  if (!count) return std::nullopt;
  const TextMark mark = FindTextMark({buffer_.data(), *count});
  if (mark.encoding != nullptr) {
    auto decoder = TextDecoder::For(mark.encoding);
    if (decoder && lseek(fd_, static_cast<off_t>(mark.bytes), SEEK_SET) >= 0) {
      Begin(std::move(decoder));
      return ReadDecoded(0);
    }
  }
  const size_t from = mark.encoding == nullptr ? mark.bytes : 0;
  const size_t head = *count - from;
  std::memmove(buffer_.data(), buffer_.data() + from, head);
  if (at_end_ || std::memchr(buffer_.data(), 0, head) != nullptr) return head;
  const auto rest = ReadPlain(head, kFirstBlockBytes - head);
  if (!rest) return std::nullopt;
  return head + *rest;
}

// A regular file gives less than asked for only at its end.
std::optional<size_t> TextReader::ReadPlain(size_t kept, size_t most) {
  const size_t room = std::min(buffer_.size() - kept, most);
  const ssize_t count = Uninterrupted([&] { return read(fd_, buffer_.data() + kept, room); });
  if (count < 0) return std::nullopt;
  at_end_ = static_cast<size_t>(count) < room;
  offset_ += static_cast<std::uint64_t>(count);
  return static_cast<size_t>(count);
}

std::optional<size_t> TextReader::ReadDecoded(size_t kept) {
  const size_t room = (buffer_.size() - kept) / TextDecoder::kGrowth - TextDecoder::kMostPending;
  encoded_.resize(std::max(encoded_.size(), room));
  const ssize_t count = Uninterrupted([&] { return read(fd_, encoded_.data(), room); });
  if (count < 0) return std::nullopt;
  at_end_ = static_cast<size_t>(count) < room;
  char* const out = buffer_.data() + kept;
  const size_t decoded = decoder_->Decode({encoded_.data(), static_cast<size_t>(count)}, out);
  return decoded + (at_end_ ? decoder_->Finish(out + decoded) : 0);
}

void TextReader::LookForForeign(size_t kept) {
  const size_t from = kept - cut_;
  const size_t at = FindForeign(text().substr(from), &cut_);
  if (at_end_ && cut_ > 0) foreign_ = offset_ - cut_;
  if (at != std::string_view::npos) foreign_ = offset_ - (filled_ - from - at);
}

}  // namespace nas
