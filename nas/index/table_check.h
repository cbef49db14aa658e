#pragma once
// Whether the bytes of a table's file may be believed. After its sums are right nothing should be
// wrong; yet each number that leads somewhere is looked at, so that whatever lies in the file,
// reading it stays within the mapping and ends.

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "nas/index/name_table.h"

namespace nas {

class TableCheck {
 public:
  // `table` has its mapping and nothing else yet.
  explicit TableCheck(NameTable& table) : table_(table), columns_(table.columns_) {}

  // 0, with the table filled in; EBADMSG or ESTALE as NameTable::Open has them.
  int Check(std::string_view file_system);

 private:
  bool SumsAreRight() const;
  bool TakeColumns();
  bool TakeInodes();
  bool EntriesAreSound() const;
  bool NamesAreSound() const;
  bool FoldersAreSound() const;
  bool FolderIsSound(NameTable::FolderId id) const;
  bool KeysAreSound() const;
  bool TreesAreSound() const;

  const TableHeader& header() const;
  size_t Count(TableColumn column, size_t size) const;
  template <typename T>
  bool Take(TableColumn column, size_t count, const T*& pointer) const;
  template <typename T>
  bool TakeAny(TableColumn column, const T*& pointer, size_t& count) const;
  bool AreTexts(const char* texts, size_t bytes, const std::uint32_t* begins, size_t count) const;

  NameTable& table_;
  NameTable::Columns& columns_;
};

}  // namespace nas
