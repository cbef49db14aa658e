#include "nas/results/foreign_accounts.h"

#include "nas/base/accounts.h"

namespace nas {
namespace {

// The file is its user's own to write to.
constexpr size_t kMostNames = 100'000;

}  // namespace

ForeignAccounts::ForeignAccounts(Database& db) {
  if (!Statement(db, "SELECT 1 FROM sqlite_master WHERE name='account'").Step()) return;
  Statement accounts(db, "SELECT id, name FROM account");
  while (accounts.Step() && names_.size() < kMostNames) {
    names_[static_cast<std::uint32_t>(accounts.Integer(0))] = std::string(accounts.Bytes(1));
  }
}

const std::string* ForeignAccounts::Foreign(std::uint32_t id) const {
  if (id < kFirstForeignId) return nullptr;
  const auto found = names_.find(id);
  return found == names_.end() ? nullptr : &found->second;
}

std::string ForeignAccounts::User(std::uint32_t id) const {
  const std::string* name = Foreign(id);
  return name != nullptr ? *name : UserText(id);
}

std::string ForeignAccounts::Group(std::uint32_t id) const {
  const std::string* name = Foreign(id);
  return name != nullptr ? *name : GroupText(id);
}

void AddForeignAccount(Database& db, std::uint32_t id, const std::string& name) {
  db.Execute("CREATE TABLE IF NOT EXISTS account(id INTEGER PRIMARY KEY, name BLOB)");
  Statement(db, "INSERT INTO account VALUES(?,?)").Bind(1, id).BindBlob(2, name).Run();
}

}  // namespace nas
