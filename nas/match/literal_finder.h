#pragma once
// Finds a plain text in a large buffer, ignoring the case of ASCII letters.
//
// Two bytes of the text, the rarest in common files, are compared with 16 places of the buffer at
// once; only where both fit is the whole text compared. Does not change once made: any thread may
// ask.

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "nas/match/text_place.h"

namespace nas {

class LiteralFinder {
 public:
  // `text` is not empty; what is not ASCII in it is found as these very bytes.
  explicit LiteralFinder(std::string_view text);
  bool Finds(std::string_view buffer) const { return Find(buffer).has_value(); }
  // The first place of it.
  std::optional<TextPlace> Find(std::string_view buffer) const;
  size_t size() const { return lowered_.size(); }

 private:
  bool MatchesAt(const char* at) const;

  // A byte fits where (byte | mask) == value: the mask folds the case of a letter.
  struct Probe {
    size_t offset = 0;
    unsigned char mask = 0;
    unsigned char value = 0;
    bool Fits(char c) const { return (static_cast<unsigned char>(c) | mask) == value; }
  };
  Probe MakeProbe(size_t offset) const;

  std::string lowered_;
  Probe first_;   // the rarest byte
  Probe second_;  // the next rarest
};

}  // namespace nas
