// Result databases read back: their user can write anything into them.

#include <sqlite3.h>

#include <filesystem>

#include "nas/results/result_reader.h"
#include "nas/results/result_writer.h"
#include "nas/results/row_block.h"
#include "tests/fuzz/fuzz.h"

namespace {

constexpr std::string_view kDatabase = "SQLite format 3";
constexpr std::uint64_t kLimit = 100;

std::string Path() { return fuzz::Scratch() + "/result.db"; }

void RemoveFile() {
  for (const char* suffix : {"", "-wal", "-shm", "-journal"}) {
    std::filesystem::remove(Path() + suffix);
  }
}

// Three rows in two blocks.
void MakeFile() {
  nas::ResultWriter writer(Path());
  writer.AddLocation(0, "photo", "/volume1/photo");
  nas::RowBlock block;
  block.SetFolder(0, "2024");
  nas::FileAttributes file;
  file.mode = 0100644;
  file.size = 10;
  block.Add("IMG_2.jpg", file);
  block.Add("IMG_10.jpg", file);
  writer.Append(block);
  block.Clear();
  file.mode = 040755;
  block.Add("folder", file);
  writer.Append(block);
  writer.Complete();
}

// What the file's user may do to it. Statements of endless work are theirs to wait for, not ours.
void Tamper(const std::string& statements) {
  constexpr int kSteps = 10'000;
  sqlite3* db = nullptr;
  DEMAND(sqlite3_open(Path().c_str(), &db) == SQLITE_OK);
  int rounds = 0;
  const auto stop = [](void* count) { return ++*static_cast<int*>(count) > 1 ? 1 : 0; };
  sqlite3_progress_handler(db, kSteps, stop, &rounds);
  sqlite3_limit(db, SQLITE_LIMIT_LENGTH, 1 << 20);
  sqlite3_exec(db, statements.c_str(), nullptr, nullptr, nullptr);
  sqlite3_close(db);
}

void CheckPage(nas::ResultReader* reader, const nas::Selection& selection) {
  reader->Begin();
  const auto page = reader->Select(selection, 0, kLimit);
  DEMAND(page.numbers.size() <= kLimit && page.numbers.size() <= page.total);
  DEMAND(page.total <= reader->rows());
  for (const std::uint32_t number : page.numbers) {
    const nas::ResultRow row = reader->Row(number);
    // Each part can be read, whatever it points into.
    const std::string name = std::string(row.share_name) + std::string(row.share_root) +
                             std::string(row.folder) + std::string(row.name);
    DEMAND(row.name.find('\0') == std::string_view::npos && row.attributes != nullptr);
    DEMAND(!name.empty() || row.name.empty());
  }
  reader->End();
}

template <typename Work>
void WhateverHappens(Work work) {
  try {
    work();
  } catch (const std::exception&) {
    // Told to the client as a listing that failed.
  }
}

void CheckFile() {
  for (const char* column : {"", "name", "path", "type", "size", "user", "mtime"}) {
    WhateverHappens([&] {
      nas::ResultReader reader(Path());
      nas::Selection selection;
      selection.column = nas::ParseSortColumn(column).value_or(nas::SortColumn::kFound);
      selection.ascending = *column != 's';
      CheckPage(&reader, selection);
      selection.pattern = *nas::Query::Parse("img !2");
      selection.directories = false;
      CheckPage(&reader, selection);
    });
  }
  WhateverHappens([] {
    nas::ResultReader reader(Path());
    reader.Purge({0});
    nas::Selection selection;
    CheckPage(&reader, selection);
    DEMAND(reader.purged(0));
  });
  WhateverHappens([] { nas::ResultReader(Path()).KeepAllOrderings(); });
}

}  // namespace

// A whole database file, or statements that change a sound one.
int fuzz::Target(std::string_view input) {
  RemoveFile();
  if (input.starts_with(kDatabase)) {
    fuzz::WriteFile(Path(), input);
  } else {
    MakeFile();
    Tamper(std::string(input));
  }
  CheckFile();
  RemoveFile();
  return fuzz::kUsed;
}
