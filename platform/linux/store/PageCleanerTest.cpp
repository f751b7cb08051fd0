#include "platform/linux/store/PageCleaner.h"

#include <cstdint>
#include <random>
#include <string>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

class PageCleanerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    writeFile(file_, "");
    ASSERT_EQ(database_.open(file_, DatabaseAccess::kReadWrite), SQLITE_OK);
    run("PRAGMA page_size = 1024; PRAGMA auto_vacuum = INCREMENTAL; PRAGMA journal_mode = WAL;"
        "PRAGMA secure_delete = OFF; CREATE TABLE t(id INTEGER PRIMARY KEY, name TEXT UNIQUE,"
        " content TEXT)");
  }
  void run(const std::string& sql) {
    ASSERT_EQ(database_.execute(sql), SQLITE_OK) << database_.errorText();
  }
  // Texts of all lengths around those that fit into a page, into one overflow page and into two.
  void fill(const std::string& word, int first, int count) {
    for (int id = first; id < first + count; ++id) {
      std::string text;
      for (auto length = random_() % 3000; text.size() < length;) text += word;
      const std::string number = std::to_string(id);
      std::string sql = "INSERT OR REPLACE INTO t VALUES (";
      sql.append(number).append(", '").append(word).append(number);
      sql.append("', '").append(text).append("')");
      run(sql);
    }
  }
  SqliteCode clean() {
    PageCleaner cleaner(file_);
    bool more = true;
    bool isHeld = false;
    SqliteCode code = SQLITE_OK;
    while (code == SQLITE_OK && more && !isHeld) code = cleaner.cleanOnce(database_, more, isHeld);
    return code;
  }

  ScratchDirectory scratch_;
  const std::filesystem::path file_ = scratch_.path() / "test.db";
  Database database_;
  std::mt19937 random_{1};
};

TEST_F(PageCleanerTest, NothingOfDeletedRowsRemains) {
  run("BEGIN");
  fill("SECRET", 0, 300);
  fill("public", 100, 100);
  fill("SECRET", 50, 20);
  run("DELETE FROM t WHERE name GLOB 'SECRET*'; COMMIT");
  const auto before = rows(file_, "SELECT id, name, length(content) FROM t");
  ASSERT_THAT(readFile(file_) + readFile(file_.native() + "-wal"), HasSubstr("SECRET"));

  ASSERT_EQ(clean(), SQLITE_OK);

  EXPECT_THAT(readFile(file_), Not(HasSubstr("SECRET")));
  EXPECT_EQ(readFile(file_.native() + "-wal"), "");
  EXPECT_THAT(rows(file_, "PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_EQ(rows(file_, "SELECT id, name, length(content) FROM t"), before);
}

TEST_F(PageCleanerTest, PagesThatAreWrittenLaterBringNothingBack) {
  run("BEGIN");
  fill("SECRET", 0, 60);
  fill("public", 100, 60);
  run("DELETE FROM t WHERE id < 100; COMMIT");
  ASSERT_EQ(clean(), SQLITE_OK);

  run("UPDATE t SET name = name || 'x'; PRAGMA wal_checkpoint(TRUNCATE)");

  EXPECT_THAT(readFile(file_), Not(HasSubstr("SECRET")));
  EXPECT_THAT(rows(file_, "PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(PageCleanerTest, DamagedPagesAreReportedAndNotChanged) {
  fill("public", 0, 60);
  run("PRAGMA wal_checkpoint(TRUNCATE)");
  std::string content = readFile(file_);
  // The number of cells of the first table.
  const std::size_t page = static_cast<std::size_t>(
      std::stoll(rows(file_, "SELECT rootpage FROM sqlite_schema WHERE name = 't'").at(0)) - 1);
  content.at(page * 1024 + 3) = '\x7f';
  database_.close();
  writeFile(file_, content);
  ASSERT_EQ(database_.open(file_, DatabaseAccess::kReadWrite), SQLITE_OK);

  EXPECT_EQ(clean(), PageCleaner::kUnexpectedForm);
  EXPECT_EQ(readFile(file_), content);
}

TEST_F(PageCleanerTest, OverflowPagesThatFormARingAreReported) {
  run("INSERT INTO t VALUES (1, 'name', CAST(zeroblob(1 << 20) AS TEXT))");
  run("PRAGMA wal_checkpoint(TRUNCATE)");
  std::string content = readFile(file_);
  const auto root = static_cast<std::size_t>(
      std::stoll(rows(file_, "SELECT rootpage FROM sqlite_schema WHERE name = 't'").at(0)));
  const std::size_t page = (root - 1) * 1024;
  const auto byteAt = [&](std::size_t at) {
    return static_cast<std::size_t>(static_cast<unsigned char>(content.at(at)));
  };
  const std::size_t cell = page + byteAt(page + 8) * 256 + byteAt(page + 9);
  // The length takes 3 bytes. A whole number of pages more leaves the cell as long as it is.
  std::size_t length = byteAt(cell) % 128 << 14U | byteAt(cell + 1) % 128 << 7U | byteAt(cell + 2);
  ASSERT_GT(length, std::size_t{1} << 20U);
  length += std::size_t{900} * 1020;
  content.at(cell) = static_cast<char>(length >> 14U | 128U);
  content.at(cell + 1) = static_cast<char>(length >> 7U | 128U);
  content.at(cell + 2) = static_cast<char>(length % 128);
  // The cell ends the page, and names the first overflow page, which now names itself.
  const std::size_t first = byteAt(page + 1022) * 256 + byteAt(page + 1023);
  content.at((first - 1) * 1024 + 2) = static_cast<char>(first / 256);
  content.at((first - 1) * 1024 + 3) = static_cast<char>(first % 256);
  database_.close();
  writeFile(file_, content);
  ASSERT_EQ(database_.open(file_, DatabaseAccess::kReadWrite), SQLITE_OK);

  EXPECT_EQ(clean(), PageCleaner::kUnexpectedForm);
}

TEST_F(PageCleanerTest, ADatabaseWithReservedBytesCannotBeCleaned) {
  EXPECT_TRUE(PageCleaner::canClean(database_));
  int reserved = 8;
  const std::filesystem::path other = scratch_.path() / "reserved.db";
  writeFile(other, "");
  Database database;
  ASSERT_EQ(database.open(other, DatabaseAccess::kReadWrite), SQLITE_OK);
  ASSERT_EQ(sqlite3_file_control(database.get(), "main", SQLITE_FCNTL_RESERVE_BYTES, &reserved),
            SQLITE_OK);
  ASSERT_EQ(database.execute("PRAGMA auto_vacuum = INCREMENTAL; CREATE TABLE t(id)"), SQLITE_OK);

  EXPECT_FALSE(PageCleaner::canClean(database));
}

TEST_F(PageCleanerTest, AReaderOfTheLogDelaysIt) {
  fill("public", 0, 10);
  Database reader;
  ASSERT_EQ(reader.open(file_, DatabaseAccess::kReadOnly), SQLITE_OK);
  ASSERT_EQ(reader.execute("BEGIN; SELECT * FROM t"), SQLITE_OK);
  fill("public", 10, 10);
  PageCleaner cleaner(file_);
  bool more = false;
  bool isHeld = false;

  ASSERT_EQ(cleaner.cleanOnce(database_, more, isHeld), SQLITE_OK);

  EXPECT_TRUE(more);
  EXPECT_TRUE(isHeld);
}

}  // namespace
}  // namespace halvox::platform::linux_
