#include "nas/match/query_json.h"

#include <array>
#include <cerrno>
#include <utility>

namespace nas {
namespace {

using Kind = QueryNode::Kind;
using Form = TextTerm::Form;

constexpr std::array<std::pair<Kind, const char*>, 19> kKinds = {{
    {Kind::kAll, "all"},           {Kind::kAny, "any"},
    {Kind::kNot, "not"},           {Kind::kText, "text"},
    {Kind::kContent, "content"},   {Kind::kExtension, "ext"},
    {Kind::kType, "type"},         {Kind::kSize, "size"},
    {Kind::kModified, "modified"}, {Kind::kCreated, "created"},
    {Kind::kOpened, "opened"},     {Kind::kOwner, "owner"},
    {Kind::kGroup, "group"},       {Kind::kDepth, "depth"},
    {Kind::kEmpty, "empty"},       {Kind::kExecutable, "executable"},
    {Kind::kExclude, "exclude"},   {Kind::kIgnored, "ignored"},
    {Kind::kOneDisk, "one disk"},
}};
constexpr std::array<std::pair<Form, const char*>, 4> kForms = {{{Form::kPlain, "plain"},
                                                                 {Form::kLiteral, "literal"},
                                                                 {Form::kRegex, "regex"},
                                                                 {Form::kWhole, "whole"}}};
constexpr int kCategories = static_cast<int>(FileCategory::kArchive) + 1;
constexpr int kAnyFile = -1;  // among the categories, as is
constexpr int kFolder = -2;
constexpr int kForm = 16;  // and the DT_* above it
constexpr int kBehindForms = kForm + 16;

// A group of the language becomes three nodes; the criteria around the pattern are a few more.
constexpr size_t kDeepest = Query::kDeepestGroup * 3 + 8;
constexpr size_t kMostNodes = Query::kMostBytes * 2;

template <class Table, class Value>
const char* NameOf(const Table& table, Value value) {
  for (const auto& [one, name] : table) {
    if (one == value) return name;
  }
  return "";
}

template <class Value, size_t count>
const Value* Named(const std::array<std::pair<Value, const char*>, count>& table,
                   const Json::Value& name) {
  for (const auto& [one, its_name] : table) {
    if (name == its_name) return &one;
  }
  return nullptr;
}

class Reader {
 public:
  bool Read(const Json::Value& json, size_t depth, QueryNode& node) {
    if (!json.isArray() || json.empty() || depth > kDeepest || ++nodes_ > kMostNodes) return false;
    const Kind* kind = Named(kKinds, json[0]);
    if (kind == nullptr) return false;
    node.kind = *kind;
    switch (node.kind) {
      case Kind::kAll:
      case Kind::kAny:
      case Kind::kNot:
        for (Json::ArrayIndex i = 1; i < json.size(); ++i) {
          if (!Read(json[i], depth + 1, node.children.emplace_back())) return false;
        }
        return node.kind != Kind::kNot || node.children.size() == 1;
      case Kind::kText:
      case Kind::kContent:
      case Kind::kExclude:
        return ReadText(json, node);
      case Kind::kEmpty:
      case Kind::kIgnored:
      case Kind::kOneDisk:
      case Kind::kExecutable:
        return json.size() == 1;
      default:
        break;
    }
    for (Json::ArrayIndex i = 1; i < json.size(); ++i) {
      if (++nodes_ > kMostNodes || !ReadValue(json[i], node)) return false;
    }
    return true;
  }

 private:
  static bool ReadText(const Json::Value& json, QueryNode& node) {
    const Form* form = json.size() == 4 ? Named(kForms, json[2]) : nullptr;
    if (form == nullptr || !json[1].isString() || !json[3].isBool()) return false;
    const std::string text = json[1].asString();
    if (text.empty() || text.size() > Query::kMostBytes || text.find('\0') != text.npos) {
      return false;
    }
    auto term = TextTerm::Make(text, *form, json[3].asBool());
    if (!term) return false;
    node.text = std::move(*term);
    return true;
  }

  static bool ReadValue(const Json::Value& json, QueryNode& node) {
    if (node.kind == Kind::kExtension) {
      if (!json.isString() || json.asString().empty()) return false;
      node.suffixes.push_back(json.asString());
      return true;
    }
    if (node.kind == Kind::kType) {
      if (!json.isInt()) return false;
      const int number = json.asInt();
      const bool form = number > kForm && number < kBehindForms;
      if (!form && (number < kFolder || number >= kCategories)) return false;
      FileType& type = node.types.emplace_back();
      type.folder = number == kFolder;
      if (form) {
        type.form = static_cast<unsigned char>(number - kForm);
      } else if (number > kAnyFile) {
        type.category = static_cast<FileCategory>(number);
      }
      return true;
    }
    if (!json.isArray() || json.size() != 2 || !json[0].isInt64() || !json[1].isInt64()) {
      return false;
    }
    node.bounds.push_back({json[0].asInt64(), json[1].asInt64()});
    return true;
  }

  size_t nodes_ = 0;
};

}  // namespace

Json::Value QueryToJson(const QueryNode& query) {
  Json::Value json(Json::arrayValue);
  json.append(NameOf(kKinds, query.kind));
  for (const QueryNode& child : query.children) json.append(QueryToJson(child));
  if (query.text) {
    json.append(query.text->given());
    json.append(NameOf(kForms, query.text->form()));
    json.append(query.text->exact());
  }
  for (const std::string& suffix : query.suffixes) json.append(suffix);
  for (const FileType& type : query.types) {
    json.append(type.folder      ? kFolder
                : type.form != 0 ? kForm + type.form
                : type.category  ? static_cast<int>(*type.category)
                                 : kAnyFile);
  }
  for (const Bounds& bounds : query.bounds) {
    Json::Value& pair = json.append(Json::arrayValue);
    pair.append(Json::Int64{bounds.from});
    pair.append(Json::Int64{bounds.to});
  }
  return json;
}

Result<QueryNode> QueryFromJson(const Json::Value& json) {
  QueryNode node;
  if (!Reader().Read(json, 0, node)) return Error{kErrorIllegal, EINVAL, "question"};
  return node;
}

}  // namespace nas
