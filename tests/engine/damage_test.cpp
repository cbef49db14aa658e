// A user can write to their own result file, and the process that reads it could become root: what
// stands in the file must not be believed. Whatever was done to it, reading ends with rows or an
// error, in little memory.

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <new>

#include "nas/results/result_reader.h"
#include "nas/results/result_writer.h"
#include "tests/nas/fixture.h"

namespace nas {
namespace {

// While it lives, the process has room for a reader and its cache, and for nothing that a small
// file merely claims.
class LittleMemory {
 public:
  LittleMemory() {
    getrlimit(RLIMIT_AS, &before_);
    size_t pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    constexpr size_t kRoom = size_t{64} << 20;
    rlimit limit = before_;
    limit.rlim_cur = pages * static_cast<size_t>(sysconf(_SC_PAGESIZE)) + kRoom;
    if (nas_test::kMemoryIsBounded) setrlimit(RLIMIT_AS, &limit);
  }
  ~LittleMemory() { setrlimit(RLIMIT_AS, &before_); }
  LittleMemory(const LittleMemory&) = delete;
  LittleMemory& operator=(const LittleMemory&) = delete;

 private:
  rlimit before_ = {};
};

constexpr std::uint64_t kAllRows = 0x7FFFFFFF;  // what listings ask for without a limit

// Reads everything in every way.
void ReadAll(const std::string& path) {
  ResultReader reader(path);
  reader.Begin();
  for (int column = 0; column <= static_cast<int>(SortColumn::kCrtime); ++column) {
    Selection selection;
    selection.column = static_cast<SortColumn>(column);
    for (const bool filtered : {false, true}) {
      if (filtered) {
        selection.directories = false;
        selection.pattern = *Query::Parse("a");
      }
      for (const std::uint32_t number : reader.Select(selection, 0, kAllRows).numbers) {
        EXPECT_LT(reader.Row(number).name.size(), 512u);
      }
    }
  }
  reader.End();
}

enum class Outcome { kRead, kRefused };

Outcome Read(const std::string& path, const std::string& what) {
  try {
    ReadAll(path);
    return Outcome::kRead;
  } catch (const std::bad_alloc&) {
    ADD_FAILURE() << what << ": memory was taken for what is not there";
  } catch (const std::exception&) {
  }
  return Outcome::kRefused;
}

class Damage : public testing::Test {
 protected:
  Damage() { std::filesystem::create_directories(folder_); }
  ~Damage() override { std::filesystem::remove_all(folder_); }

  std::string MakeFile() const {
    const std::string path = ResultPath(folder_, NewResultId());
    ResultWriter writer(path);
    writer.AddLocation(0, "share", "/s");
    RowBlock block;
    for (const char* folder : {"folder", "folder/below"}) {
      block.SetFolder(0, folder);
      for (const char* name : {"a", "ab"}) block.Add(name, {.size = 1, .mode = S_IFREG});
      writer.Append(block);
    }
    writer.Complete();
    return path;
  }

  const std::string folder_ = testing::TempDir() + "damage-" + NewResultId();
};

TEST_F(Damage, ValuesThatCannotBe) {
  const char* const damages[] = {
      "UPDATE attributes SET first=first+1000000",
      "UPDATE attributes SET first=first-1",
      "UPDATE attributes SET data=zeroblob(1000000)",
      "UPDATE attributes SET data=zeroblob(56*5000)",
      "UPDATE attributes SET data=x'00'",
      "UPDATE attributes SET data=NULL",
      "UPDATE attributes SET data=zeroblob(52)||x'01000000'",
      "UPDATE names SET first=first+1000000",
      "UPDATE names SET first=first+(1<<31) WHERE first=2",
      "UPDATE names SET first=first+(1<<32)-5 WHERE first=2",
      "UPDATE names SET first=first+(1<<62) WHERE first=2",
      "UPDATE names SET first=-1 WHERE first=0",
      "UPDATE names SET count=1",
      "UPDATE names SET count=-1",
      "UPDATE names SET count=1<<31",
      "UPDATE names SET count=1<<40",
      "UPDATE names SET count='many'",
      "UPDATE names SET names=x''",
      "UPDATE names SET folders=x''",
      "UPDATE names SET folders=x'ffff00ffff00'",
      "UPDATE names SET folders=zeroblob(3000000)",
      "UPDATE names SET names=zeroblob(1000000)",
      "DELETE FROM names",
      "DELETE FROM attributes",
      "DELETE FROM names WHERE first=0",
      "DELETE FROM attributes WHERE first=0",
      "DELETE FROM location",
      "UPDATE location SET id=1",
      "INSERT INTO location VALUES(1<<16,'a','b')",
      "INSERT INTO location VALUES(-1,'a','b')",
      "INSERT INTO purged VALUES(1<<32)",
      "INSERT INTO purged VALUES(-1)",
      "INSERT INTO ordering VALUES((1<<32),x'ffffff7fffffff7f'),((6<<32),x'ffffff7fffffff7f')",
      "INSERT INTO ordering VALUES((1<<32),x'')",
      "INSERT INTO ordering VALUES((1<<32),zeroblob(5000000))",
      "PRAGMA user_version=2",
      "DROP TABLE purged",
      "DROP TABLE ordering; CREATE TABLE ordering(id,data)",
  };
  EXPECT_EQ(Read(MakeFile(), "whole"), Outcome::kRead);
  for (const char* damage : damages) {
    const std::string path = MakeFile();
    Database(path, SQLITE_OPEN_READWRITE, 0).Execute(damage);
    const LittleMemory limited;
    Read(path, damage);
  }
}

// Of a file of small pages, so that every byte has its turn.
TEST_F(Damage, EveryCutAndEveryByte) {
  const std::string path = MakeFile();
  {
    Database file(path, SQLITE_OPEN_READWRITE, 0);
    sqlite3_limit(file.handle(), SQLITE_LIMIT_ATTACHED, 1);  // which VACUUM needs
    file.Execute("PRAGMA journal_mode=DELETE; PRAGMA page_size=512; VACUUM");
  }
  std::ifstream file(path, std::ios::binary);
  const std::string whole{std::istreambuf_iterator<char>(file), {}};
  ASSERT_LT(whole.size(), 20'000u);
  ASSERT_EQ(Read(path, "whole"), Outcome::kRead);
  std::fstream bytes(path, std::ios::binary | std::ios::in | std::ios::out);
  const auto set = [&bytes](size_t at, int byte) {
    bytes.seekp(static_cast<std::streamoff>(at)).put(static_cast<char>(byte)).flush();
  };
  const LittleMemory limited;
  for (size_t at = 0; at < whole.size(); ++at) {
    const int byte = static_cast<unsigned char>(whole[at]);
    for (const int flip : {0xFF, 0x01}) {
      set(at, byte ^ flip);
      Read(path, "byte " + std::to_string(at) + " by " + std::to_string(flip));
    }
    set(at, byte);
  }
  ASSERT_EQ(Read(path, "whole again"), Outcome::kRead);
  for (size_t length = whole.size(); length-- > 0;) {
    std::filesystem::resize_file(path, length);
    EXPECT_EQ(Read(path, "cut"), Outcome::kRefused) << "to " << length;
  }
}

}  // namespace
}  // namespace nas
