#pragma once
// A JSON text read piece by piece, in its order and without making a value of it: for texts of many
// rows, of which a value would take ten times as long. The text may be of anybody's making.
//
// Numbers that are taken are whole ones. Strings keep their bytes, which need not be UTF-8.

#include <concepts>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace nas {

// Each function but TakeNull takes what stands next, and says false where that is something else;
// nothing more can be read then. Of what is no JSON nothing can be.
class JsonPull {
 public:
  // A text of more than kJsonMaxValues (json_text.h) pieces, the ends of objects and arrays and the
  // names of members among them, is none either. Throws std::bad_alloc.
  explicit JsonPull(std::string text);
  JsonPull(const JsonPull&) = delete;
  JsonPull& operator=(const JsonPull&) = delete;

  bool TakeString(std::string* text);
  bool TakeBool(bool* value);
  // Nothing beyond the type's numbers.
  template <std::integral T>
  bool TakeNumber(T* value);
  // Whether null stands next; it is taken then, and otherwise nothing is.
  bool TakeNull() { return Take(Kind::kNull); }
  // Any one value.
  bool Skip();
  // Whether nothing is left.
  bool AtEnd() const { return Next().kind == Kind::kEnd; }

  // An object or array: `take` is called for each member, with its name, or element, and takes the
  // value.
  template <typename Function>
  bool TakeObject(const Function& take);
  template <typename Function>
  bool TakeArray(const Function& take);
  // An array of so many: its beginning, and its end.
  bool EnterArray() { return Take(Kind::kArray); }
  bool LeaveArray() { return Take(Kind::kArrayEnd); }

 private:
  friend class JsonPullHandler;

  enum class Kind : std::uint8_t {
    kNull,
    kFalse,
    kTrue,
    kPositive,  // or 0
    kNegative,
    kOtherNumber,
    kString,  // a member's name too
    kObject,
    kObjectEnd,
    kArray,
    kArrayEnd,
    kEnd,
  };
  struct Piece {
    Kind kind;
    std::uint64_t number = 0;  // its bits, of a negative one
    std::string_view text = {};
  };

  const Piece& Next() const { return pieces_[next_]; }
  bool Take(Kind kind) {
    if (Next().kind != kind) return false;
    ++next_;
    return true;
  }

  std::string text_;  // whose strings lie in their places, as they are meant
  std::vector<Piece> pieces_;
  size_t next_ = 0;
};

template <std::integral T>
bool JsonPull::TakeNumber(T* value) {
  const Piece& piece = Next();
  const auto negative = static_cast<std::int64_t>(piece.number);
  const bool fits = (piece.kind == Kind::kPositive && std::in_range<T>(piece.number)) ||
                    (piece.kind == Kind::kNegative && std::in_range<T>(negative));
  if (!fits) return false;
  *value = static_cast<T>(piece.number);
  ++next_;
  return true;
}

template <typename Function>
bool JsonPull::TakeObject(const Function& take) {
  if (!Take(Kind::kObject)) return false;
  std::string name;
  while (!Take(Kind::kObjectEnd)) {
    if (!TakeString(&name) || !take(name)) return false;
  }
  return true;
}

template <typename Function>
bool JsonPull::TakeArray(const Function& take) {
  if (!EnterArray()) return false;
  while (!LeaveArray()) {
    if (!take()) return false;
  }
  return true;
}

}  // namespace nas
