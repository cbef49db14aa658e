#pragma once
// The contents of one file after another as text, in bounded pieces. A file is never mapped: one
// that shrinks or a disk that fails ends in an error, not a signal.

#include <optional>
#include <string_view>
#include <vector>

#include "nas/match/text_decoder.h"

namespace nas {

// For one thread. Its buffers are made once.
class TextReader {
 public:
  // A piece has up to `piece_bytes`. `beyond_ascii`: bytes that are not UTF-8 are looked for.
  TextReader(size_t piece_bytes, bool beyond_ascii);

  // Begins with the file open at `fd`, which is borrowed, at its first byte.
  void Start(int fd);
  // Begins it once more in the encoding that the foreign bytes are most likely in. False where
  // there were none, or where that is not known.
  bool StartGuessed();

  enum class Piece { kText, kBinary, kFailed };
  // Reads on; the last `keep` bytes of text() stay at its front. kBinary, for files with a NUL in
  // their first block, can only be the first; kFailed leaves errno.
  Piece Next(size_t keep);
  // As bytes where they may be UTF-8, decoded from what a mark or a guess says where not.
  std::string_view text() const { return {buffer_.data(), filled_}; }
  bool at_end() const { return at_end_; }

 private:
  void Begin(std::optional<TextDecoder> decoder);
  // Both return how many bytes they added; nothing where reading failed.
  std::optional<size_t> ReadPlain(size_t kept, size_t most);
  std::optional<size_t> ReadDecoded(size_t kept);
  std::optional<size_t> ReadFirst();
  void LookForForeign(size_t kept);

  const bool beyond_ascii_;
  std::vector<char> buffer_;
  std::vector<char> encoded_;  // what is to be decoded
  int fd_ = -1;
  std::optional<TextDecoder> decoder_;
  size_t filled_ = 0;
  bool first_ = true;
  bool at_end_ = false;
  std::uint64_t offset_ = 0;  // in the file, behind what has been read
  size_t cut_ = 0;            // bytes at the end of a piece that the next one goes on with
  std::optional<std::uint64_t> foreign_;  // where in the file the first such byte is, about
};

}  // namespace nas
