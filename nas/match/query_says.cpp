#include "nas/match/query_says.h"

#include <dirent.h>

#include <array>
#include <ctime>
#include <functional>

namespace nas {
namespace {

using Kind = QueryNode::Kind;

std::string Quoted(std::string_view text) { return "“" + std::string(text) + "”"; }

std::string Either(const std::vector<std::string>& all) {
  std::string text;
  for (size_t i = 0; i < all.size(); ++i) {
    text += (i == 0 ? "" : i + 1 < all.size() ? ", " : " or ") + all[i];
  }
  return text;
}

// In the largest unit that needs no more than two digits behind the point.
std::string SizeText(std::int64_t bytes) {
  constexpr std::string_view kUnits = "PTGMK";
  constexpr int kBitsPerUnit = 10;
  constexpr std::int64_t kHundred = 100;
  constexpr std::int64_t kTen = 10;
  for (size_t i = 0; i < kUnits.size(); ++i) {
    const std::int64_t unit = std::int64_t{1}
                              << (static_cast<int>(kUnits.size() - i) * kBitsPerUnit);
    const __int128 hundredths = static_cast<__int128>(bytes) * kHundred;
    if (bytes < unit || hundredths % unit != 0) continue;
    const auto number = static_cast<std::int64_t>(hundredths / unit);
    std::string text = std::to_string(number / kHundred);
    const std::int64_t part = number % kHundred;
    if (part != 0) text += "." + std::to_string(part / kTen);
    if (part % kTen != 0) text += std::to_string(part % kTen);
    return text + " " + kUnits[i] + "B";
  }
  return std::to_string(bytes) + (bytes == 1 ? " byte" : " bytes");
}

// Whether the size is a whole number of no unit while its neighbour is: that one was written.
bool IsBeside(std::int64_t bytes, std::int64_t neighbour) {
  return SizeText(bytes).ends_with('s') && SizeText(neighbour).ends_with('B');
}

std::string SayBounds(const Bounds& bounds, std::string_view unit,
                      const std::function<std::string(std::int64_t)>& text) {
  const std::string behind(unit);
  const bool from = bounds.from > Bounds::kLeast;
  const bool to = bounds.to < Bounds::kMost;
  if (from && to && bounds.from == bounds.to) return text(bounds.from) + behind;
  if (from && to) return text(bounds.from) + " to " + text(bounds.to) + behind;
  if (from) return text(bounds.from) + behind + " or more";
  return to ? "up to " + text(bounds.to) + behind : "any";
}

std::string SaySize(const Bounds& bounds) {
  const bool above = bounds.from > 0 && IsBeside(bounds.from, bounds.from - 1);
  const bool below = bounds.to < Bounds::kMost && IsBeside(bounds.to, bounds.to + 1);
  if (!above && !below) return SayBounds(bounds, "", SizeText);
  const bool from = bounds.from > Bounds::kLeast;
  const bool to = bounds.to < Bounds::kMost;
  std::string text;
  if (from)
    text = above ? "more than " + SizeText(bounds.from - 1) : SizeText(bounds.from) + " or more";
  if (from && to) text += ", and ";
  if (to) text += below ? "less than " + SizeText(bounds.to + 1) : "up to " + SizeText(bounds.to);
  return text;
}

// The day alone where it begins then, or with `last` ends.
std::string TimeText(std::int64_t second, bool last) {
  constexpr std::string_view kMidnight = " 00:00:00";
  constexpr std::string_view kLastSecond = " 23:59:59";
  constexpr size_t kSeconds = 3;  // ":00"
  const std::time_t time = second;
  std::tm local{};
  if (localtime_r(&time, &local) == nullptr) return std::to_string(second);
  std::array<char, 64> buffer{};
  const size_t size = std::strftime(buffer.data(), buffer.size(), "%Y-%m-%d %H:%M:%S", &local);
  std::string text(buffer.data(), size);
  const std::string_view whole = last ? kLastSecond : kMidnight;
  if (text.ends_with(whole)) {
    text.resize(text.size() - whole.size());
  } else if (text.ends_with(whole.substr(whole.size() - kSeconds))) {
    text.resize(text.size() - kSeconds);
  }
  return text;
}

std::string SayTime(const Bounds& bounds) {
  const bool from = bounds.from > Bounds::kLeast;
  const bool to = bounds.to < Bounds::kMost;
  const std::string first = from ? TimeText(bounds.from, false) : "";
  const std::string last = to ? TimeText(bounds.to, true) : "";
  if (from && to) return first == last ? "on " + first : "from " + first + " to " + last;
  if (from) return "since " + first;
  return to ? "until " + last : "at any time";
}

std::string SayEachBounds(const QueryNode& leaf, std::string (*say)(const Bounds&)) {
  std::vector<std::string> all;
  for (const Bounds& bounds : leaf.bounds) all.push_back(say(bounds));
  return Either(all);
}

std::string TypeText(const FileType& type) {
  static constexpr std::array<const char*, 5> kCategories = {"picture", "video", "audio",
                                                             "document", "archive"};
  if (type.folder) return "folder";
  if (type.category) return kCategories.at(static_cast<size_t>(*type.category));
  switch (type.form) {
    case DT_LNK:
      return "link";
    case DT_FIFO:
      return "pipe";
    case DT_SOCK:
      return "socket";
    case DT_BLK:
    case DT_CHR:
      return "device";
    default:
      return "file";
  }
}

void AddTypes(const QueryNode& leaf, std::vector<std::string>& all) {
  for (const FileType& type : leaf.types) {
    const std::string text = TypeText(type);
    if (all.empty() || all.back() != text) all.push_back(text);
  }
  if (leaf.kind == Kind::kExecutable) all.emplace_back("executable");
  if (leaf.kind == Kind::kEmpty) all.emplace_back("empty");
  for (const QueryNode& child : leaf.children) AddTypes(child, all);
}

std::string SayTypes(const QueryNode& leaf) {
  std::vector<std::string> all;
  AddTypes(leaf, all);
  return Either(all);
}

std::string SayText(const TextTerm& text, bool of_content) {
  const std::string exactly = text.exact() ? ", capitals as written" : "";
  if (of_content) {
    return (text.is_regex() ? "a text inside that matches " + text.given()
                            : Quoted(text.text()) + " inside the file") +
           exactly;
  }
  if (text.is_regex()) return "a name that matches " + text.given() + exactly;
  const std::string where = text.of_path() ? "path" : "name";
  if (text.has_wildcards()) return "a " + where + " like " + text.given() + exactly;
  return Quoted(text.text()) + " in the " + where + exactly;
}

std::string SayExcluded(const QueryPiece& piece) {
  if (piece.prefix->value != QueryPrefix::Value::kChoice) return "without " + piece.value;
  return "without names that begin with a dot";
}

std::string SayLetters(const QueryPiece& piece) {
  switch (ParseLetters(piece.value).value_or(Letters::kAny)) {
    case Letters::kExact:
      return "capitals and accents count";
    case Letters::kSmart:
      return "capitals count in words that have one";
    case Letters::kAny:
      break;
  }
  return "capitals do not count";
}

}  // namespace

std::string SayLeaf(const QueryPiece& piece, const QueryNode& leaf) {
  if (piece.prefix != nullptr && piece.prefix->kind == Kind::kType) return SayTypes(leaf);
  if (piece.prefix != nullptr && leaf.kind == Kind::kAll && leaf.children.empty()) {
    return "leaves nothing out";  // hidden:yes and its like
  }
  switch (leaf.kind) {
    case Kind::kText:
    case Kind::kContent:
      return SayText(*leaf.text, leaf.kind == Kind::kContent);
    case Kind::kExtension:
      return "a name that ends in " + Either(leaf.suffixes);
    case Kind::kSize:
      return SayEachBounds(leaf, SaySize);
    case Kind::kModified:
      return "modified " + SayEachBounds(leaf, SayTime);
    case Kind::kCreated:
      return "created " + SayEachBounds(leaf, SayTime);
    case Kind::kOpened:
      return "opened " + SayEachBounds(leaf, SayTime);
    case Kind::kDepth:
      return SayEachBounds(leaf, [](const Bounds& bounds) {
        return SayBounds(bounds, " levels down", [](std::int64_t n) { return std::to_string(n); });
      });
    case Kind::kOwner:
      return "owned by " + piece.value;
    case Kind::kGroup:
      return "of the group " + piece.value;
    case Kind::kEmpty:
      return "with nothing in it";
    case Kind::kNot:
      return "with something in it";
    case Kind::kIgnored:
      return "without what .gitignore and its like leave out";
    case Kind::kOneDisk:
      return "on one file system";
    case Kind::kLetters:
      return SayLetters(piece);
    default:  // exclude:, of one name or several
      return SayExcluded(piece);
  }
}

}  // namespace nas
