#pragma once
// File names as they are compared: NFC-normalised and fully case-folded, so that a name written by
// a client that decomposes its letters, or in other case, is the same name. A name that is not
// valid UTF-8 is compared byte by byte, with only its ASCII letters folded. Nothing here fails, and
// any thread may call.

#include <string>
#include <string_view>

namespace nas {

bool IsAscii(std::string_view text);
// Whether folding may turn something in `text` that is not ASCII into ASCII characters: the Kelvin
// sign into "k", the sharp s into "ss", a ligature into its letters. May say yes for a few others.
// Where the answer is no, the ASCII parts of the folded text are those of the text itself.
bool MayFoldToAscii(std::string_view text);
std::string AsciiLower(std::string_view text);
// The text as it is compared; `valid` (may be null) receives whether it was valid UTF-8.
std::string FoldText(std::string_view text, bool* valid = nullptr);
// The text in NFC, case kept; unchanged where it is not valid UTF-8.
std::string ComposeText(std::string_view text);

// One name and its folded form, made when first asked for. Reused for name after name by one
// thread, so that a walk over ASCII names allocates nothing.
class FoldedName {
 public:
  // `name` must outlive the use of this object for it; what folded() gave of the last one ends.
  void Set(std::string_view name) {
    name_ = name;
    state_ = State::kUnknown;
  }
  std::string_view name() const { return name_; }
  std::string_view folded() {
    if (state_ == State::kUnknown) Fold();
    return folded_;
  }
  bool ascii() {
    if (state_ == State::kUnknown) Fold();
    return state_ == State::kAscii;
  }
  bool valid_utf8() {
    if (state_ == State::kUnknown) Fold();
    return state_ != State::kBroken;
  }

 private:
  enum class State { kUnknown, kAscii, kUtf8, kBroken };
  void Fold();

  std::string_view name_;
  std::string folded_;
  State state_ = State::kUnknown;
};

}  // namespace nas
