#include "arbory/server/service/openapi.h"

#include <strings.h>

#include <initializer_list>

#include "nas/base/json_text.h"

namespace arbory {
namespace {

constexpr char kSearch[] = "NUVA.Arbory.Search";
constexpr char kHistory[] = "NUVA.Arbory.Search.History";

struct Parameter {
  const char* api;
  const char* method;
  const char* name;
  const char* type;  // of JSON; two, separated by a space, where either will do
  bool required;
  const char* description;
};

constexpr Parameter kParameters[] = {
    {kSearch, "start", "folder_path", "string array", true,
     "Folders to search, /SHARE or /SHARE/below, separated by commas; from version 2 on also a "
     "list. /home is the user's own folder."},
    {kSearch, "start", "pattern", "string", false,
     "Names to find. Words all have to match; * ? [ ] compare the whole name; a|b is either, !a "
     "is not, \"a b\" one word, regex: a regular expression. At least one criterion is needed."},
    {kSearch, "start", "extension", "string", false, "Extensions, separated by , ; or spaces."},
    {kSearch, "start", "filetype", "string", false,
     "file, dir, image, video, audio, document or archive."},
    {kSearch, "start", "owner", "string", false, "Name of a user; an unknown one is ignored."},
    {kSearch, "start", "group", "string", false, "Name of a group; an unknown one is ignored."},
    {kSearch, "start", "size_from", "integer", false, "Bytes, inclusive."},
    {kSearch, "start", "size_to", "integer", false, "Bytes, inclusive."},
    {kSearch, "start", "mtime_from", "integer", false, "Modified then or later; epoch seconds."},
    {kSearch, "start", "mtime_to", "integer", false, "Modified then or earlier; epoch seconds."},
    {kSearch, "start", "crtime_from", "integer", false, "Created then or later; epoch seconds."},
    {kSearch, "start", "crtime_to", "integer", false, "Created then or earlier; epoch seconds."},
    {kSearch, "start", "atime_from", "integer", false, "Last read then or later; epoch seconds."},
    {kSearch, "start", "atime_to", "integer", false, "Last read then or earlier; epoch seconds."},
    {kSearch, "start", "recursive", "boolean", false, "Enter the folders inside."},
    {kSearch, "start", "search_content", "boolean", false,
     "Find also files whose contents hold the pattern."},
    {kSearch, "start", "search_type", "string", false,
     "simple, the default, or advance: the history that the search enters."},
    {kSearch, "list", "taskid", "string", true, "The search, as start named it."},
    {kSearch, "list", "offset", "integer", false, "Rows to leave out; 0 by default."},
    {kSearch, "list", "limit", "integer", false, "Rows in the page; 0, the default, for all."},
    {kSearch, "list", "sort_by", "string", false,
     "name, path, size, type, user, group, mode, mtime, atime, ctime or crtime."},
    {kSearch, "list", "sort_direction", "string", false, "ASC or DESC."},
    {kSearch, "list", "filetype", "string", false, "dir or file; both by default."},
    {kSearch, "list", "pattern", "string", false, "Only names that match this too."},
    {kSearch, "list", "additional", "string array", false,
     "Attributes to show: real_path, size, owner, time, perm, type; separated by commas."},
    {kSearch, "stop", "taskid", "string array", true, "Searches, separated by commas."},
    {kSearch, "clean", "taskid", "string array", true, "Searches, separated by commas."},
    {kHistory, "get", "search_type", "string", false, "simple, the default, or advance."},
    {kHistory, "get", "offset", "integer", false, "Records to leave out."},
    {kHistory, "get", "limit", "integer", false, "Records to return; 0 for all."},
    {kHistory, "set", "search_type", "string", false, "simple, the default, or advance."},
    {kHistory, "set", "pattern", "string", true, "What was searched for."},
    {kHistory, "set", "folder_path", "string array", false, "Where it was searched for."},
    {kHistory, "set", "recursive", "boolean", false, "Whether folders inside were entered."},
    {kHistory, "delete", "search_type", "string", false, "simple, the default, or advance."},
};

struct Method {
  const char* api;
  const char* method;
  const char* summary;
  const char* reply;   // schema of "data", as JSON text
  const char* errors;  // codes it may give
};

constexpr Method kMethods[] = {
    {kSearch, "start", "Start a search",
     R"({"type":"object","properties":{"taskid":{"type":"string"},
        "has_not_index_share":{"type":"boolean"}}})",
     "400 no folder; 401 no task (too many searches run), or no process"},
    {kSearch, "list", "One page of what a search has found so far",
     R"({"type":"object","properties":{"files":{"type":"array","items":
        {"$ref":"#/components/schemas/File"}},"total":{"type":"integer"},
        "offset":{"type":"integer"},"finished":{"type":"boolean"}},"required":["finished"]})",
     "400 no taskid; 401 identity; 600 the results are not ready or cannot be read"},
    {kSearch, "stop", "Stop searches; what they found stays listable", R"({"type":"null"})",
     "400 no taskid"},
    {kSearch, "clean", "Stop searches and delete what they found", R"({"type":"object"})",
     "400 no taskid"},
    {kHistory, "get", "Searches made before, the newest first",
     R"({"type":"object","properties":{"history":{"type":"array","items":{"type":"object"}},
        "total":{"type":"integer"}}})",
     "none"},
    {kHistory, "set", "Remember a search", R"({"type":"null"})", "401 no pattern, or not stored"},
    {kHistory, "delete", "Forget all searches of one kind", R"({"type":"null"})",
     "401 not deleted"},
};

constexpr char kComponents[] = R"({
  "schemas": {
    "Error": {"type": "object", "required": ["code", "error"], "properties": {
      "code": {"type": "integer"}, "error": {"type": "string"}}},
    "File": {"type": "object", "required": ["name", "path", "is_dir"], "properties": {
      "name": {"type": "string"}, "path": {"type": "string"},
      "path_encoded": {"type": "string"}, "is_dir": {"type": "boolean"},
      "real_path": {"type": "string"}, "size": {"type": "integer"}, "type": {"type": "string"},
      "owner": {"type": "object"}, "time": {"type": "object"}, "perm": {"type": "object"}}}
  },
  "responses": {"Error": {"description": "The server itself refuses; a sentence says what to do.",
    "content": {"application/json": {"schema": {"$ref": "#/components/schemas/Error"}}}}},
  "securitySchemes": {"session": {"type": "apiKey", "in": "cookie"}}
})";

Json::Value Parsed(const char* text) {
  Json::Value value;
  nas::ParseJson(text, &value);
  return value;
}

Json::Value TypeOf(const std::string& type) {
  const size_t space = type.find(' ');
  if (space == std::string::npos) return type;
  Json::Value both(Json::arrayValue);
  both.append(type.substr(0, space));
  both.append(type.substr(space + 1));
  return both;
}

Json::Value BodySchema(const std::string& api, const std::string& method) {
  Json::Value schema;
  schema["type"] = "object";
  for (const Parameter& parameter : kParameters) {
    if (api != parameter.api || method != parameter.method) continue;
    Json::Value& property = schema["properties"][parameter.name];
    property["type"] = TypeOf(parameter.type);
    property["description"] = parameter.description;
    if (parameter.required) schema["required"].append(parameter.name);
  }
  return schema;
}

Json::Value CallResponses(const Method* method) {
  Json::Value ok;
  ok["description"] = std::string("The call was made; code 0 is success. Other codes: ") +
                      (method == nullptr ? "see the API" : method->errors) +
                      ". 100 the call failed inside.";
  Json::Value& schema = ok["content"]["application/json"]["schema"];
  schema["type"] = "object";
  schema["required"] = Parsed(R"(["code","data"])");
  schema["properties"]["code"]["type"] = "integer";
  Json::Value& data = schema["properties"]["data"];
  data["anyOf"].append(method == nullptr ? Json::Value(Json::objectValue) : Parsed(method->reply));
  data["anyOf"].append(Parsed(R"({"description":"Of an error"})"));
  Json::Value responses;
  responses["200"] = ok;
  return responses;
}

void AddErrors(std::initializer_list<const char*> statuses, Json::Value* responses) {
  for (const char* status : statuses) {
    (*responses)[status]["$ref"] = "#/components/responses/Error";
  }
}

// The pattern with `values` in the place of its parts in braces.
std::string FilledIn(std::string pattern, std::initializer_list<std::string> values) {
  for (const std::string& value : values) {
    const size_t open = pattern.find('{');
    pattern.replace(open, pattern.find('}', open) + 1 - open, value);
  }
  return pattern;
}

void AddAccess(const Route& route, Json::Value* operation) {
  if (route.access == Access::kLoggedIn) {
    (*operation)["security"] = Parsed(R"([{"session":[]}])");
  }
}

const char* Verb(const Route& route) { return route.method == RouteMethod::kPost ? "post" : "get"; }

void AddCall(const Route& route, const NUVA::APIMethod& row, Json::Value* paths) {
  const Method* known = nullptr;
  for (const Method& method : kMethods) {
    if (std::string(method.api) == row.api && strcasecmp(method.method, row.method) == 0) {
      known = &method;
    }
  }
  const std::string version = std::to_string(row.version);
  const std::string path = FilledIn(route.pattern, {row.api, version, row.method});
  Json::Value& operation = (*paths)[path][Verb(route)];
  operation["summary"] = known == nullptr ? row.method : known->summary;
  operation["operationId"] = std::string(row.api) + "." + version + "." + row.method;
  AddAccess(route, &operation);
  operation["requestBody"]["content"][route.reply_type]["schema"] = BodySchema(row.api, row.method);
  operation["responses"] = CallResponses(known);
  AddErrors({"400", "401", "403", "404", "413", "415", "503"}, &operation["responses"]);
}

void AddRoute(const Route& route, Json::Value* paths) {
  std::string path = route.pattern;
  const size_t many = path.find(kManyParts);
  if (many != std::string::npos) path.replace(many, std::string_view(kManyParts).size(), "}");
  Json::Value& operation = (*paths)[path][Verb(route)];
  operation["summary"] = route.summary;
  AddAccess(route, &operation);
  Json::Value& ok = operation["responses"]["200"];
  ok["description"] = "As docs/http.md says.";
  ok["content"][route.reply_type] = Json::Value(Json::objectValue);
  AddErrors({"400", "401", "403", "404", "429", "503"}, &operation["responses"]);
  for (size_t open = path.find('{'); open != std::string::npos; open = path.find('{', open + 1)) {
    Json::Value parameter;
    parameter["name"] = path.substr(open + 1, path.find('}', open) - open - 1);
    parameter["in"] = "path";
    parameter["required"] = true;
    parameter["schema"]["type"] = "string";
    operation["parameters"].append(parameter);
  }
}

}  // namespace

std::string OpenApiText(const nas::Module& module, std::span<const Route> routes,
                        const std::string& cookie) {
  Json::Value document;
  document["openapi"] = "3.1.0";
  document["info"]["title"] = "Arbory Search";
  document["info"]["version"] = ARBORY_VERSION;
  document["components"] = Parsed(kComponents);
  document["components"]["securitySchemes"]["session"]["name"] = cookie;
  for (const Route& route : routes) {
    if (route.summary == nullptr) continue;
    if (route.pattern != std::string_view(kCallPattern)) {
      AddRoute(route, &document["paths"]);
      continue;
    }
    for (const NUVA::APIMethod* row = module.table(); row->api != nullptr; ++row) {
      AddCall(route, *row, &document["paths"]);
    }
  }
  return nas::JsonText(document, nas::JsonBytes::kClean);
}

}  // namespace arbory
