// Histories read back: a damaged file, or whole ones whose records are not what this program
// writes.

#include <filesystem>

#include "nas/base/json_text.h"
#include "nas/base/sqlite.h"
#include "platform/filedb.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/module_calls.h"

namespace {

using fuzz::Call;
using fuzz::Outcome;
using fuzz::Side;

constexpr std::string_view kDatabase = "SQLite format 3";
constexpr size_t kMostRecords = 16;

std::string Path() { return fuzz::Preference() + "/search_history.db"; }

// A store whose records have the lines as their bodies.
void MakeStore(std::string_view lines) {
  DEMAND(NUVA::WEBFM::FileDB(Path()).IsGood());
  nas::Database db(Path(), SQLITE_OPEN_READWRITE, 0);
  db.Execute("PRAGMA synchronous=OFF");
  nas::Transaction transaction(db, nas::Transaction::Kind::kWrite);
  nas::Statement insert(db, "INSERT INTO records(body) VALUES(?1)");
  for (size_t i = 0; i < kMostRecords && !lines.empty(); ++i) {
    insert.BindBlob(1, fuzz::Take(&lines, '\n')).Run();
  }
  transaction.Commit();
}

Outcome Get(int limit = 0) {
  Call call{"get", 1, Side::kParent, {}};
  call.params["limit"] = limit;
  return fuzz::Make(call);
}

void CheckGet() {
  const Outcome all = Get();
  DEMAND(all.code == 0);
  const Json::Value& records = all.data["history"];
  DEMAND(all.data["total"] == records.size());
  const Json::Value first = Get(1).data["history"];
  DEMAND(first.size() <= 1 && (first.empty() || first[0] == records[0]));
  DEMAND(!first.empty() || records.empty());
}

// What was remembered is the newest, once, among no more than a history holds.
void CheckSet() {
  Call call{"set", 1, Side::kParent, {}};
  call.params["pattern"] = "fuzz";
  const Outcome set = fuzz::Make(call);
  if (set.code != 0) return;
  const Json::Value records = Get().data["history"];
  DEMAND(records.size() >= 1 && records.size() <= 10);
  DEMAND(records[0]["pattern"] == "fuzz");
  for (Json::ArrayIndex i = 1; i < records.size(); ++i) {
    DEMAND(!records[i].isObject() || records[i]["pattern"] != "fuzz");
  }
  DEMAND(fuzz::Make({"delete", 1, Side::kParent, {}}).code == 0);
  DEMAND(Get().data["history"].empty());
}

}  // namespace

// A whole database file, or the bodies of records, a line each.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::PreparePlatform();
  fuzz::CleanPlatform();
  const std::string_view input = fuzz::Text(data, size);
  if (input.starts_with(kDatabase)) {
    fuzz::WriteFile(Path(), input);
  } else {
    MakeStore(input);
  }
  CheckGet();
  CheckSet();
  fuzz::CleanPlatform();
  return fuzz::kUsed;
}
