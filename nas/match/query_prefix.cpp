#include "nas/match/query_prefix.h"

#include <dirent.h>
#include <utf8proc.h>

#include <algorithm>
#include <cerrno>

#include "nas/base/accounts.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;
using Value = QueryPrefix::Value;

constexpr std::string_view kTimeHelp =
    "write a time as in today, last-7-days, 2026, 2026-07-15, >2-weeks-ago or 2026-01..2026-06";

constexpr std::string_view kTimeValues =
    "today yesterday last-7-days last-30-days this-month last-month last-12-months this-year "
    "last-year";

constexpr QueryPrefix kPrefixes[] = {
    {"ext:", Kind::kExtension, Value::kWords, "write extensions, as in ext:jpg,png",
     "how the name ends: jpg,png"},
    {"type:", Kind::kType, Value::kWords,
     "there are file, dir, link, executable, empty, pipe, socket, device, image, video, audio, "
     "document and archive",
     "what it is: image, video, dir",
     "file dir image video audio document archive link executable empty pipe socket device"},
    {"size:", Kind::kSize, Value::kSize, "write a size as in size:>10MB, size:1GB..2GB or size:0",
     "how large: >10MB, 1GB..2GB", ">1MB >100MB >1GB <10KB 1MB..10MB 0"},
    {"modified:", Kind::kModified, Value::kTime, kTimeHelp, "when it was changed: last-7-days",
     kTimeValues},
    {"created:", Kind::kCreated, Value::kTime, kTimeHelp, "when it was made: 2026-07", kTimeValues},
    {"opened:", Kind::kOpened, Value::kTime, kTimeHelp, "when it was read: <2025", kTimeValues},
    {"owner:", Kind::kOwner, Value::kWords, "write a user's name, as in owner:ann", "whose it is"},
    {"group:", Kind::kGroup, Value::kWords, "write a group's name, as in group:staff",
     "of which group it is"},
    {"content:", Kind::kContent, Value::kText, "write a text, as in content:invoice",
     "a text inside files"},
    {"exclude:", Kind::kExclude, Value::kGlobs,
     "write names, as in exclude:node_modules or exclude:*.tmp,cache/",
     "names to leave out, with all that is in them", "@eaDir .git node_modules *.tmp"},
    {"depth:", Kind::kDepth, Value::kNumber,
     "write a number of levels, as in depth:1, depth:<3 or depth:2..4",
     "how many folders down: 1, <3", "1 <3 2..4"},
    {"empty:", Kind::kEmpty, Value::kNothing, "it takes no value, or yes or no",
     "nothing is in the file or folder", "yes no"},
    {"hidden:", Kind::kExclude, Value::kChoice,
     "write hidden:no to leave out what begins with a dot", "names that begin with a dot: no",
     "no yes"},
    {"ignored:", Kind::kIgnored, Value::kChoice,
     "write ignored:no to leave out what .gitignore and its like do",
     "what .gitignore and its like leave out: no", "no yes"},
    {"mounts:", Kind::kOneDisk, Value::kChoice, "write mounts:no to stay on one file system",
     "other file systems below the folder: no", "no yes"},
    {"letters:", Kind::kLetters, Value::kLetters,
     "write letters:exact, letters:smart or letters:any", "whether capitals count",
     "exact smart any"},
    {"case:", Kind::kText, Value::kExact, "write a name, as in case:README",
     "a text whose capitals count"},
    {"regex:", Kind::kText, Value::kRegex, "", "a regular expression"},
};

ValueReader ReaderOf(Value value, std::time_t now) {
  switch (value) {
    case Value::kSize:
      return ReadSize;
    case Value::kTime:
      return [now](std::string_view text) -> std::optional<WrittenValue> {
        // So few seconds after 1970 are an age that lacks its unit.
        constexpr size_t kFewDigits = 3;
        const bool digits = text.find_first_not_of("0123456789") == std::string_view::npos;
        if (digits && text.size() <= kFewDigits) return std::nullopt;
        return ReadTime(text, now);
      };
    default:
      return ReadNumber;
  }
}

Error Wrong(const QueryPrefix& prefix) { return {kErrorIllegal, EINVAL, std::string(prefix.help)}; }

Result<std::int64_t> AccountNumber(Kind kind, const std::string& name) {
  const bool user = kind == Kind::kOwner;
  Error error;
  if (user) {
    const auto account = FindAccount(name);
    if (account) return std::int64_t{account->uid};
    error = account.error();
  } else {
    const auto group = FindGroup(name);
    if (group) return std::int64_t{group->gid};
    error = group.error();
  }
  // Files of somebody who has left have but a number.
  if (const auto number = ReadNumber(name); number) return number->span.from;
  const bool unknown = error.kind == kErrorUnknownUser || error.kind == kErrorUnknownGroup;
  return error.Of(unknown
                      ? "there is no " + std::string(user ? "user" : "group") + " '" + name + "'"
                      : "users and groups cannot be looked up just now");
}

// Types go by several names, of one or of many, and by a letter.
std::string TypeName(std::string_view word) {
  static constexpr std::pair<std::string_view, std::string_view> kNames[] = {
      {"folder", "dir"},  {"directory", "dir"}, {"directorie", "dir"}, {"picture", "image"},
      {"photo", "image"}, {"movie", "video"},   {"film", "video"},     {"music", "audio"},
      {"sound", "audio"}, {"doc", "document"},  {"symlink", "link"},   {"fifo", "pipe"},
      {"f", "file"},      {"d", "dir"},         {"l", "link"},         {"p", "pipe"},
      {"s", "socket"},    {"b", "block"},       {"c", "char"},         {"x", "executable"},
      {"e", "empty"}};
  std::string name = AsciiLower(word);
  if (name.size() > 1 && name.ends_with('s')) name.pop_back();
  const auto* const known =
      std::ranges::find_if(kNames, [&](const auto& one) { return one.first == name; });
  return known == std::end(kNames) ? name : std::string(known->second);
}

// By what the file is, not by what its name says.
void AddForms(std::string_view name, QueryNode& node) {
  static constexpr std::pair<std::string_view, unsigned char> kForms[] = {
      {"file", DT_REG},   {"link", DT_LNK},  {"pipe", DT_FIFO},  {"socket", DT_SOCK},
      {"device", DT_BLK}, {"block", DT_BLK}, {"device", DT_CHR}, {"char", DT_CHR}};
  for (const auto& [word, form] : kForms) {
    if (word == name) node.types.push_back({.form = form});
  }
}

// A type that takes more than the name to tell is a node of its own, beside the others.
Status AddType(const QueryPrefix& prefix, std::string_view word, QueryNode& node) {
  const std::string name = TypeName(word);
  if (name == "executable" || name == "empty") {
    node.children.push_back({.kind = name == "empty" ? Kind::kEmpty : Kind::kExecutable});
    return {};
  }
  const size_t before = node.types.size();
  AddForms(name, node);
  if (node.types.size() > before) return {};
  const auto type = ParseFileType(name);
  if (!type) return Wrong(prefix);
  node.types.push_back(*type);
  return {};
}

// What AddType has made, as one node.
QueryNode TypesNode(QueryNode node) {
  if (node.children.empty()) return node;
  QueryNode any{.kind = Kind::kAny};
  any.children.swap(node.children);
  if (!node.types.empty()) any.children.push_back(std::move(node));
  return any;
}

Status AddWord(const QueryPrefix& prefix, std::string_view word, QueryNode& node) {
  if (prefix.kind == Kind::kExtension) {
    std::ranges::move(ExtensionNode(word).suffixes, std::back_inserter(node.suffixes));
    return {};
  }
  if (prefix.kind == Kind::kType) return AddType(prefix, word, node);
  const auto number = AccountNumber(prefix.kind, std::string(word));
  if (!number) return number.error();
  node.bounds.push_back({*number, *number});
  return {};
}

Error WrongBounds(const QueryPrefix& prefix, std::string_view value, std::time_t now) {
  constexpr std::string_view kDots = "..";
  const size_t dots = value.find(kDots);
  if (dots == std::string_view::npos) return Wrong(prefix);
  const std::string first(value.substr(0, dots));
  const std::string last(value.substr(dots + kDots.size()));
  const std::string swapped = last + std::string(kDots) + first;
  if (!IsValueOf(prefix, swapped, now)) return Wrong(prefix);
  return {kErrorIllegal, EINVAL, "it ends before it begins; write " + swapped};
}

Status AddValue(const QueryPrefix& prefix, std::string_view value, std::time_t now,
                QueryNode& node) {
  if (value.empty()) return Wrong(prefix);
  if (prefix.value == Value::kWords) return AddWord(prefix, value, node);
  const auto bounds = ReadBounds(value, ReaderOf(prefix.value, now));
  if (!bounds) return WrongBounds(prefix, value, now);
  node.bounds.push_back(*bounds);
  return {};
}

Result<QueryNode> EmptyNode(const QueryPrefix& prefix, std::string_view value) {
  const std::string word = AsciiLower(value);
  QueryNode node{.kind = Kind::kEmpty};
  if (word.empty() || word == "yes" || word == "true") return node;
  if (word != "no" && word != "false") return Wrong(prefix);
  QueryNode other{.kind = Kind::kNot};
  other.children.push_back(std::move(node));
  return other;
}

Result<QueryNode> ExcludeNode(std::string_view glob, Letters letters) {
  auto text = TextTerm::Make(glob, TextTerm::Form::kWhole, IsExact(letters, glob, false));
  if (!text) return text.error();
  QueryNode node{.kind = Kind::kExclude};
  node.text = std::move(*text);
  return node;
}

Result<QueryNode> GlobsNode(const QueryPrefix& prefix, std::string_view value, Letters letters) {
  QueryNode all;
  for (size_t at = 0; at <= value.size();) {
    const size_t end = EndOfGlob(value, at);
    const std::string_view glob = value.substr(at, end - at);
    at = end + 1;
    if (glob.find_first_not_of('/') == std::string_view::npos) return Wrong(prefix);
    auto node = ExcludeNode(glob, letters);
    if (!node) return node.error();
    all.children.push_back(std::move(*node));
  }
  return all;
}

Result<QueryNode> ChoiceNode(const QueryPrefix& prefix, std::string_view value) {
  const std::string word = AsciiLower(value);
  if (word == "yes" || word == "true") return QueryNode();
  if (word != "no" && word != "false") return Wrong(prefix);
  if (prefix.kind == Kind::kExclude) return ExcludeNode(kHiddenGlob, Letters::kAny);
  return QueryNode{.kind = prefix.kind};
}

// Behind the escape of an expression that begins at `at`, or the name of a group.
size_t BehindEscape(std::string_view text, size_t at) {
  constexpr std::string_view kGroups[] = {"(?<", "(?P<", "(?'"};
  if (text[at] == '\\') {
    const bool property =
        text.substr(at + 1).starts_with("p{") || text.substr(at + 1).starts_with("P{");
    return property ? std::min(text.find('}', at), text.size() - 1) + 1 : at + 2;
  }
  for (const std::string_view group : kGroups) {
    if (text.substr(at).starts_with(group)) {
      return std::min(text.find_first_of(">'", at + group.size()), text.size() - 1) + 1;
    }
  }
  return at;
}

}  // namespace

size_t EndOfGlob(std::string_view value, size_t at) {
  size_t open = 0;
  for (; at < value.size(); ++at) {
    if (value[at] == '\\')
      ++at;
    else if (value[at] == '{')
      ++open;
    else if (value[at] == '}' && open > 0)
      --open;
    else if (value[at] == ',' && open == 0)
      return at;
  }
  return value.size();
}

std::span<const QueryPrefix> QueryPrefixes() { return kPrefixes; }

const QueryPrefix* FindPrefix(std::string_view text) {
  constexpr size_t kLongest = 9;  // "modified:"
  const size_t colon = text.substr(0, kLongest).find(':');
  if (colon == std::string_view::npos) return nullptr;
  const std::string word = AsciiLower(text.substr(0, colon + 1));
  const auto* found = std::ranges::find(kPrefixes, word, &QueryPrefix::name);
  return found == std::end(kPrefixes) ? nullptr : found;
}

std::optional<Letters> ParseLetters(std::string_view value) {
  const std::string word = AsciiLower(value);
  if (word == "exact") return Letters::kExact;
  if (word == "smart") return Letters::kSmart;
  return word == "any" ? std::optional(Letters::kAny) : std::nullopt;
}

bool IsExact(Letters letters, std::string_view text, bool is_regex) {
  if (letters != Letters::kSmart) return letters == Letters::kExact;
  for (size_t at = 0; at < text.size();) {
    if (is_regex) {
      const size_t behind = BehindEscape(text, at);
      if (behind > at) {
        at = behind;
        continue;
      }
    }
    utf8proc_int32_t letter = 0;
    const auto length = utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t*>(&text[at]),
                                         static_cast<utf8proc_ssize_t>(text.size() - at), &letter);
    if (length > 0 && utf8proc_isupper(letter) != 0) return true;
    at += static_cast<size_t>(std::max<utf8proc_ssize_t>(length, 1));
  }
  return false;
}

bool IsValueOf(const QueryPrefix& prefix, std::string_view value, std::time_t now) {
  return ReadBounds(value, ReaderOf(prefix.value, now)).has_value();
}

Result<QueryNode> PrefixNode(const QueryPrefix& prefix, std::string_view value, std::time_t now,
                             Letters letters) {
  if (prefix.value == Value::kNothing) return EmptyNode(prefix, value);
  if (prefix.value == Value::kGlobs) return GlobsNode(prefix, value, letters);
  if (prefix.value == Value::kChoice) return ChoiceNode(prefix, value);
  if (prefix.value == Value::kLetters) {
    if (!ParseLetters(value)) return Wrong(prefix);
    return QueryNode{.kind = Kind::kLetters};
  }
  QueryNode node{.kind = prefix.kind};
  for (size_t at = 0; at <= value.size();) {
    const size_t end = std::min(value.find(',', at), value.size());
    const Status added = AddValue(prefix, value.substr(at, end - at), now, node);
    if (!added) return added.error();
    at = end + 1;
  }
  if (node.kind == Kind::kExtension && node.suffixes.empty()) return Wrong(prefix);
  return TypesNode(std::move(node));
}

QueryNode ExtensionNode(std::string_view list) {
  constexpr std::string_view kSeparators = ",; ";
  QueryNode node{.kind = Kind::kExtension};
  size_t at = 0;
  while ((at = list.find_first_not_of(kSeparators, at)) != std::string_view::npos) {
    const size_t end = std::min(list.find_first_of(kSeparators, at), list.size());
    std::string_view extension = list.substr(at, end - at);
    at = end;
    if (extension.starts_with("*.")) extension.remove_prefix(1);
    if (extension.starts_with(".")) extension.remove_prefix(1);
    if (!extension.empty()) node.suffixes.push_back("." + FoldText(extension));
  }
  return node;
}

QueryNode BoundsNode(QueryNode::Kind kind, Bounds bounds) {
  QueryNode node{.kind = kind};
  node.bounds.push_back(bounds);
  return node;
}

}  // namespace nas
