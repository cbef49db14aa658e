#pragma once
// File names as they are compared: NFC-normalised and fully case-folded, so that a name written by
// a client that decomposes its letters, or in other case, is the same name. A second form has no
// accents either, for whoever typed none: the marks on Latin, Greek and Cyrillic letters, and no
// others, since in other scripts marks are vowels. A name that is not valid UTF-8 is compared byte
// by byte, with only its ASCII letters folded. Nothing here fails, and any thread may call.

#include <string>
#include <string_view>

namespace nas {

bool IsAscii(std::string_view text);
// Whether folding, or taking accents away, may turn something in `text` that is not ASCII into
// ASCII characters, or bring some together: the Kelvin sign into "k", the sharp s into "ss", a
// ligature into its letters, "\u00e9" into "e". May say yes for others. Where the answer is no, the
// ASCII parts of both forms are those of the text itself.
bool MayFoldToAscii(std::string_view text);
// Names which rules and whose tables of characters folding follows: what was folded under another
// version may have become something else.
std::string FoldVersion();
// All ASCII runs of both forms of `text`, in lower case, with \x80 in the place of other letters:
// what is ASCII and not in it is in neither form. Takes a fraction of the time of making them.
// False where only they can tell.
bool AsciiSkeleton(std::string_view text, std::string& out);
std::string AsciiLower(std::string_view text);
// The text as it is compared; `valid` (may be null) receives whether it was valid UTF-8.
std::string FoldText(std::string_view text, bool* valid = nullptr);
// A folded text without its accents; unchanged where it has none or is not valid UTF-8.
std::string WithoutAccents(std::string_view folded);
// Whether the text is surely valid UTF-8 and in NFC, at a glance. No says nothing: it knows the
// common characters only.
bool IsComposed(std::string_view text);
// Appends the text in NFC, case kept. False, with nothing appended, where it is not valid UTF-8.
bool AppendComposed(std::string_view text, std::string* out);
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
    has_plain_ = false;
  }
  // `name` is ASCII without capital letters, and so its own folded form.
  void SetFolded(std::string_view name) {
    name_ = name;
    state_ = State::kAscii;
    folded_ = name;
    has_plain_ = false;
  }
  // `name` is valid UTF-8, not ASCII, and its own folded form; `plain`: without accents.
  void SetFolded(std::string_view name, std::string_view plain) {
    name_ = name;
    state_ = State::kUtf8;
    folded_ = name;
    plain_ = plain;
    has_plain_ = true;
  }
  std::string_view name() const { return name_; }
  std::string_view folded() {
    if (state_ == State::kUnknown) Fold();
    return folded_;
  }
  // The folded form without accents.
  std::string_view plain() {
    if (ascii() || state_ == State::kBroken) return folded_;
    if (!has_plain_) plain_ = WithoutAccents(folded_);
    has_plain_ = true;
    return plain_;
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
  std::string_view folded_;
  std::string buffer_;
  std::string plain_;
  bool has_plain_ = false;
  State state_ = State::kUnknown;
};

}  // namespace nas
