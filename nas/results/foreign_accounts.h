#pragma once
// Names of accounts of other machines. Rows that other machines have found keep the numbers of
// accounts that this machine has too, by name; for names that it does not have the result file has
// numbers of its own, from kFirstForeignId on, and says in a table what they stand for. Files
// without such rows have no such table.

#include <cstdint>
#include <map>
#include <string>

#include "nas/base/sqlite.h"

namespace nas {

// Far above what directories give out.
inline constexpr std::uint32_t kFirstForeignId = 0xF000'0000;

// Where shares of other machines lie, in the place of a folder of this one: rows below it are not
// looked up here.
inline constexpr char kFleetRoot[] = "/fleet:/";

class ForeignAccounts {
 public:
  // Of the file; none without the table. Throws SqliteError.
  explicit ForeignAccounts(Database& db);

  // The name, as nas/base/accounts.h tells it where the number is this machine's.
  std::string User(std::uint32_t id) const;
  std::string Group(std::uint32_t id) const;
  const std::map<std::uint32_t, std::string>& names() const { return names_; }
  // Null for a number of this machine's.
  const std::string* Foreign(std::uint32_t id) const;

 private:
  std::map<std::uint32_t, std::string> names_;  // users and groups share the numbers
};

// Throws SqliteError.
void AddForeignAccount(Database& db, std::uint32_t id, const std::string& name);

}  // namespace nas
