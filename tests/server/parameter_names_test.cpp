// A parameter's name stands in several places, and one that is forgotten in one of them is silently
// not asked for. The tables of docs/api.md are what all others are compared with, both ways: what
// the module reads, what the description for programs names, and what the terminal's options send.

#include <json/value.h>
#include <sys/mman.h>

#include <CLI/CLI.hpp>
#include <atomic>
#include <chrono>
#include <cstring>
#include <map>
#include <set>
#include <sstream>

#include "arbory/command_line.h"
#include "arbory/search_request.h"
#include "arbory/server/service/openapi.h"
#include "arbory/server/service/service.h"
#include "nas/base/json_text.h"
#include "nas/webapi/module.h"
#include "nas/webapi/runner.h"
#include "tests/nas/fixture.h"

namespace {

constexpr char kSearch[] = "NUVA.Arbory.Search";
constexpr char kHistory[] = "NUVA.Arbory.Search.History";

struct Parameter {
  std::string type;
  bool required = false;
};
using Parameters = std::map<std::string, Parameter>;
using Names = std::set<std::string>;

Names NamesOf(const Parameters& parameters) {
  Names names;
  for (const auto& [name, parameter] : parameters) names.insert(name);
  return names;
}

std::vector<std::string> Cells(const std::string& line) {
  std::vector<std::string> cells;
  std::istringstream in(line.substr(1));
  for (std::string cell; std::getline(in, cell, '|');) {
    const size_t first = cell.find_first_not_of(' ');
    const size_t last = cell.find_last_not_of(' ');
    cells.push_back(first == std::string::npos ? "" : cell.substr(first, last - first + 1));
  }
  return cells;
}

// "API method" -> the parameters of its table.
std::map<std::string, Parameters> Documented() {
  std::map<std::string, Parameters> methods;
  std::istringstream text(nas_test::ReadFile(ARBORY_SOURCE_DIR "/docs/api.md"));
  std::string api, method;
  bool in_table = false;
  for (std::string line; std::getline(text, line);) {
    if (line.starts_with("## ")) api = line.substr(3);
    if (line.starts_with("### ")) method = line.substr(4);
    in_table = line.starts_with("| parameter |") || (in_table && line.starts_with('|'));
    if (!in_table || !line.starts_with("| `")) continue;
    const auto cells = Cells(line);
    std::istringstream names(cells.at(0));
    for (std::string name; std::getline(names, name, '`') && std::getline(names, name, '`');) {
      methods[api + " " + method][name] = {cells.at(1), cells.at(2) == "required"};
    }
  }
  return methods;
}

// What the module asks for in a call, also in the processes that the call forks: those go on when
// the next call has begun, and may end at any moment.
struct Asked {
  static constexpr size_t kMost = 4096;
  static constexpr size_t kBytes = 64;
  struct Question {
    std::atomic<int> call;  // 0 until the name is there
    char name[kBytes];
  };
  std::atomic<size_t> count;
  Question questions[kMost];
};
Asked* g_asked = nullptr;
int g_call = 0;
const NUVA::APIMethod* g_row = nullptr;

class ListeningRequest : public NUVA::APIRequest {
 public:
  explicit ListeningRequest(const NUVA::APIRequest& inner) : inner_(inner) {}
  std::string GetLoginUserName() const override { return inner_.GetLoginUserName(); }
  std::string GetSessionID() const override { return inner_.GetSessionID(); }
  std::string GetPreferenceDir() const override { return inner_.GetPreferenceDir(); }
  std::string GetAPIMethod() const override { return inner_.GetAPIMethod(); }
  int GetAPIVersion() const override { return inner_.GetAPIVersion(); }
  bool HasParam(const std::string& name) const override {
    Note(name);
    return inner_.HasParam(name);
  }
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const override {
    Note(name);
    return inner_.GetParam(name, fallback);
  }

 private:
  static void Note(const std::string& name) {
    const size_t at = g_asked->count++;
    if (at >= Asked::kMost) return;
    strncpy(g_asked->questions[at].name, name.c_str(), Asked::kBytes - 1);
    g_asked->questions[at].call = g_call;
  }
  const NUVA::APIRequest& inner_;
};

void Listen(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  ListeningRequest listening(*request);
  g_row->entry(&listening, response);
}

// Values that a search takes, one for every name.
std::string AllCriteria(const Parameters& names) {
  Json::Value params;
  const std::map<std::string, std::string> words = {
      {"folder_path", "/photo"}, {"extension", "txt"}, {"filetype", "file"},
      {"owner", "root"},         {"group", "root"},    {"search_type", "simple"}};
  for (const auto& [name, parameter] : names) {
    if (parameter.type == "integer") {
      params[name] = 1;
    } else if (parameter.type == "boolean") {
      params[name] = false;
    } else {
      params[name] = words.contains(name) ? words.at(name) : "a";
    }
  }
  return nas::JsonText(params, nas::JsonBytes::kClean);
}

class ParameterNamesTest : public nas_test::PlatformTest {
 protected:
  void SetUp() override {
    PlatformTest::SetUp();
    const std::string photo = MakeFolder("photo", 0777);
    nas_test::WriteFile(photo + "/a.txt", "a");
    Configure({{"photo", photo}});
    void* shared =
        mmap(nullptr, sizeof(Asked), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(shared, MAP_FAILED);
    g_asked = new (shared) Asked;
    documented_ = Documented();
  }
  void TearDown() override {
    munmap(g_asked, sizeof(Asked));
    PlatformTest::TearDown();
  }

  // A call whose asking is noted.
  Json::Value Call(const char* api, int version, const std::string& method,
                   const std::string& params) {
    g_row = module_.Find(api, version, method);
    ++g_call;
    return Run({api, version, g_row->method, Listen}, method, params);
  }
  Json::Value RunPlain(const std::string& method, const std::string& params) {
    return Run(*module_.Find(kSearch, 2, method), method, params);
  }
  static Json::Value Run(const NUVA::APIMethod& row, const std::string& method,
                         const std::string& params) {
    Json::Value parsed, reply;
    EXPECT_TRUE(nas::ParseJson(params, &parsed)) << params;
    const nas::ApiCall call = {method, parsed, nas_test::Me(), "test"};
    EXPECT_TRUE(nas::ParseJson(nas::RunCall(row, call, nas::EncodeJsonReply).body, &reply));
    EXPECT_EQ(reply["code"], 0) << method << params;
    return reply["data"];
  }
  // In the last call, so far.
  static Names AskedNames() {
    EXPECT_LE(g_asked->count, Asked::kMost);
    Names names;
    for (size_t at = 0; at < g_asked->count; ++at) {
      const Asked::Question& question = g_asked->questions[at];
      if (question.call == g_call) names.insert(question.name);
    }
    return names;
  }

  const nas::Module module_{ARBORY_BIN_DIR "/NUVA.Arbory.Search.so"};
  std::map<std::string, Parameters> documented_;
};

TEST_F(ParameterNamesTest, TheModuleReadsWhatIsDocumented) {
  // Cleaning goes on in a process of its own when the call has been answered.
  const auto expect = [&](const std::string& method) {
    const Names expected = NamesOf(documented_[method]);
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (AskedNames().size() < expected.size() && std::chrono::steady_clock::now() < end) {
    }
    EXPECT_EQ(AskedNames(), expected) << method;
  };
  const std::string search = kSearch;
  const std::string history = kHistory;
  Call(kHistory, 1, "set", R"({"pattern":"a"})");
  expect(history + " set");
  Call(kHistory, 1, "get", "{}");
  expect(history + " get");
  Call(kHistory, 1, "delete", "{}");
  expect(history + " delete");
  const std::string start = AllCriteria(documented_[search + " start"]);
  const std::string id = Call(kSearch, 2, "start", start)["taskid"].asString();
  const std::string task = "{\"taskid\":\"" + id + "\"}";
  // The walk reads some in a process of its own: the start is over when the search is.
  while (!RunPlain("list", task)["finished"].asBool()) {
  }
  expect(search + " start");
  Call(kSearch, 2, "list", task);
  expect(search + " list");
  // Some names are read in several places, so it counts what became of them.
  const auto kept = Call(kHistory, 1, "get", "{}")["history"][0].getMemberNames();
  Names criteria = NamesOf(documented_[search + " start"]);
  criteria.erase("search_content");
  criteria.erase("search_type");
  EXPECT_EQ(Names(kept.begin(), kept.end()), criteria) << "in the history";
  Call(kSearch, 2, "stop", task);
  expect(search + " stop");
  Call(kSearch, 2, "clean", task);
  expect(search + " clean");
  Call(kSearch, 2, "Clean", R"({"action":"cleanall"})");
  expect(search + " clean-all");
}

TEST_F(ParameterNamesTest, TheDescriptionNamesWhatIsDocumented) {
  Json::Value document;
  ASSERT_TRUE(nas::ParseJson(OpenApiText(module_, arbory::Service::Routes(), "cookie"), &document));
  size_t methods = 0;
  for (const NUVA::APIMethod* row = module_.table(); row->api != nullptr; ++row, ++methods) {
    const std::string path =
        "/api/" + std::string(row->api) + "/" + std::to_string(row->version) + "/" + row->method;
    const Json::Value& schema =
        document["paths"][path]["post"]["requestBody"]["content"]["application/json"]["schema"];
    const Parameters& expected = documented_[std::string(row->api) + " " + row->method];
    const auto named = schema["properties"].getMemberNames();
    EXPECT_EQ(Names(named.begin(), named.end()), NamesOf(expected)) << path;
    Names required, described_as_required;
    for (const Json::Value& name : schema["required"])
      described_as_required.insert(name.asString());
    for (const auto& [name, parameter] : expected) {
      if (parameter.required) required.insert(name);
      if (parameter.type == "any") continue;
      const Json::Value& type = schema["properties"][name]["type"];
      EXPECT_EQ(type.isArray() ? "string or array" : type.asString(), parameter.type)
          << path << " " << name;
    }
    EXPECT_EQ(described_as_required, required) << path;
  }
  EXPECT_EQ(documented_.size(), 8U) << "four methods, one more that has no row, three of histories";
}

TEST_F(ParameterNamesTest, TheTerminalOffersWhatIsDocumented) {
  const std::map<std::string, std::string> samples = {
      {"EXT", "jpg"},   {"TYPE", "dir"},   {"SIZE", "1"}, {"TIME", "1"},
      {"USER", "root"}, {"GROUP", "root"}, {"GLOB", "x"}, {"N", "1"}};
  const auto request = [](std::vector<std::string> reversed_words) {
    CLI::App app;
    arbory::SearchQuery query;
    arbory::AddQueryOptions(&app, &query);
    app.parse(reversed_words);
    return arbory::SearchRequest(query, {"/photo"}, 0);
  };
  const Json::Value plain = request({"a"});
  Names offered = {"pattern", "folder_path"};
  CLI::App app;
  arbory::SearchQuery unused;
  arbory::AddQueryOptions(&app, &unused);
  for (const CLI::Option* option : app.get_options()) {
    if (option->get_positional() || option == app.get_help_ptr()) continue;
    if (option->get_group().empty()) continue;  // offered to nobody
    std::vector<std::string> words = {"a", option->get_name()};
    if (option->get_items_expected_max() > 0) {
      const std::string type = option->get_type_name();  // and, behind a colon, what it may be
      words.insert(words.begin() + 1, samples.at(type.substr(0, type.find(':'))));
    }
    const Json::Value changed = request(words);
    Names names;
    for (const std::string& name : changed.getMemberNames()) {
      if (changed[name] != plain[name]) names.insert(name);
    }
    // What is so anyway changes nothing.
    const bool usual = option->get_description().ends_with("as usual");
    EXPECT_TRUE(names.size() == 1 || (usual && names.empty())) << option->get_name();
    offered.insert(names.begin(), names.end());
  }
  Names expected = NamesOf(documented_[std::string(kSearch) + " start"]);
  expected.erase("search_type");  // every search of the terminal enters the simple history
  EXPECT_EQ(offered, expected);
}

}  // namespace
