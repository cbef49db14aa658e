#include "nas/base/json_pull.h"

#include <rapidjson/reader.h>

#include "nas/base/json_text.h"

namespace nas {

// Notes what the reader tells of.
class JsonPullHandler {
 public:
  using Kind = JsonPull::Kind;
  using Length = rapidjson::SizeType;

  explicit JsonPullHandler(std::vector<JsonPull::Piece>* pieces) : pieces_(*pieces) {}

  bool Null() { return Add({Kind::kNull}); }
  bool Bool(bool value) { return Add({value ? Kind::kTrue : Kind::kFalse}); }
  bool Int(int value) { return Int64(value); }
  bool Uint(unsigned value) { return Uint64(value); }
  bool Int64(std::int64_t value) {
    return Add({value < 0 ? Kind::kNegative : Kind::kPositive, static_cast<std::uint64_t>(value)});
  }
  bool Uint64(std::uint64_t value) { return Add({Kind::kPositive, value}); }
  bool Double(double /*value*/) { return Add({Kind::kOtherNumber}); }
  bool RawNumber(const char* /*text*/, Length /*length*/, bool /*copy*/) { return false; }
  bool String(const char* text, Length length, bool /*copy*/) {
    return Add({Kind::kString, 0, {text, length}});
  }
  bool Key(const char* text, Length length, bool copy) { return String(text, length, copy); }
  bool StartObject() { return Add({Kind::kObject}); }
  bool EndObject(Length /*members*/) { return Add({Kind::kObjectEnd}); }
  bool StartArray() { return Add({Kind::kArray}); }
  bool EndArray(Length /*elements*/) { return Add({Kind::kArrayEnd}); }

 private:
  bool Add(JsonPull::Piece piece) {
    if (pieces_.size() == kJsonMaxValues) return false;
    pieces_.push_back(piece);
    return true;
  }

  std::vector<JsonPull::Piece>& pieces_;
};

JsonPull::JsonPull(std::string text) : text_(std::move(text)) {
  // Without recursion, however deep it is.
  constexpr unsigned kHow = rapidjson::kParseInsituFlag | rapidjson::kParseIterativeFlag;
  rapidjson::InsituStringStream stream(text_.data());
  JsonPullHandler handler(&pieces_);
  const bool whole = rapidjson::Reader().Parse<kHow>(stream, handler) &&
                     stream.Tell() == text_.size();  // a NUL ends it too
  if (!whole) pieces_.clear();
  pieces_.push_back({Kind::kEnd});
}

bool JsonPull::TakeString(std::string* text) {
  text->assign(Next().text);
  return Take(Kind::kString);
}

bool JsonPull::TakeBool(bool* value) {
  *value = Take(Kind::kTrue);
  return *value || Take(Kind::kFalse);
}

bool JsonPull::Skip() {
  size_t depth = 0;
  do {
    switch (Next().kind) {
      case Kind::kObject:
      case Kind::kArray:
        ++depth;
        break;
      case Kind::kObjectEnd:
      case Kind::kArrayEnd:
        if (depth == 0) return false;
        --depth;
        break;
      case Kind::kEnd:
        return false;
      default:
        break;
    }
    ++next_;
  } while (depth > 0);
  return true;
}

}  // namespace nas
