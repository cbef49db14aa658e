// Histories read back: a damaged file, or whole ones whose records are not what this program
// writes.

#include "nas/base/sqlite.h"
#include "platform/filedb.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/module_calls.h"

namespace {

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

fuzz::Outcome Ask(const char* method, const char* name, const Json::Value& value) {
  fuzz::Call call{method};
  call.params[name] = value;
  return fuzz::Make(call);
}
Json::Value Get(int limit) {
  const fuzz::Outcome all = Ask("get", "limit", limit);
  DEMAND(all.code == 0 && all.data["total"] == all.data["history"].size());
  return all.data["history"];
}

// What was remembered is the newest, once, among no more than a history holds.
void CheckSet() {
  if (Ask("set", "pattern", "fuzz").code != 0) return;
  const Json::Value records = Get(0);
  DEMAND(records.size() >= 1 && records.size() <= 10);
  DEMAND(records[0]["pattern"] == "fuzz");
  for (Json::ArrayIndex i = 1; i < records.size(); ++i) {
    DEMAND(!records[i].isObject() || records[i]["pattern"] != "fuzz");
  }
  DEMAND(fuzz::Make({"delete"}).code == 0 && Get(0).empty());
}

}  // namespace

// A whole database file, or the bodies of records, a line each.
int fuzz::Target(std::string_view input) {
  PreparePlatform();
  CleanPlatform();
  if (input.starts_with(kDatabase)) {
    WriteFile(Path(), input);
  } else {
    MakeStore(input);
  }
  const Json::Value all = Get(0);
  const Json::Value first = Get(1);
  DEMAND(first.empty() == all.empty() && (first.empty() || first[0] == all[0]));
  CheckSet();
  CleanPlatform();
  return kUsed;
}
