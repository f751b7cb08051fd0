#pragma once

#include <cstdint>
#include <filesystem>
#include <utility>
#include <vector>

#include "platform/linux/store/Sqlite.h"

struct sqlite3_file;

namespace halvox::platform::linux_ {

// Overwrites with zeros what the pages of a database do not use: the space between and after their
// cells, the ends of overflow pages, and free pages. SQLite leaves bytes of deleted and of moved
// records there. Its setting secure_delete is not enough, because it leaves copies of moved cells.
//
// Works on the database file itself, in steps. Before each step the write-ahead log is copied into
// the file and emptied; without a log, nothing but this connection writes the file, and no
// connection uses the bytes that change. Readers therefore read on. A crash in the middle leaves a
// sound database, in which the rest is not overwritten.
//
// Two passes over the file: SQLite may copy a whole page between two steps, with its unused space.
// The connection must have secure_delete enabled until the last step, so that free pages that are
// used again bring nothing back. Needs a database with a page map (auto_vacuum) and without
// reserved bytes, in which an extension of SQLite may keep a checksum of the page; see canClean().
// Belongs to the writer's thread.
class PageCleaner {
 public:
  // A page is not as SQLite makes it. This is not SQLITE_CORRUPT, at which the store would set the
  // database aside, because SQLite itself has not complained.
  static constexpr SqliteCode kUnexpectedForm = SQLITE_FORMAT;

  explicit PageCleaner(std::filesystem::path database) : database_(std::move(database)) {}

  [[nodiscard]] static bool canClean(Database& database);
  // Cleans some pages. Sets `more` to whether pages remain, and `isHeld` to whether a reader held
  // the log, in which case no page was cleaned. Do not call inside a transaction, or while a
  // statement is being stepped. Returns an error of SQLite, or kUnexpectedForm.
  [[nodiscard]] SqliteCode cleanOnce(Database& database, bool& more, bool& isHeld);

 private:
  using Page = std::vector<unsigned char>;

  [[nodiscard]] SqliteCode cleanSome(Database& database, bool& more);
  [[nodiscard]] SqliteCode cleanFreePages();
  [[nodiscard]] SqliteCode cleanPage(std::uint32_t number);
  [[nodiscard]] SqliteCode cleanTree(std::uint32_t number, Page& page);
  [[nodiscard]] SqliteCode cleanOverflow(std::uint32_t first, std::uint64_t bytes);
  [[nodiscard]] SqliteCode isTree(std::uint32_t number, bool& result);
  [[nodiscard]] SqliteCode read(std::uint32_t number, Page& page);
  // Writes zeros from `begin` to `end` of the page unless they are there already.
  [[nodiscard]] SqliteCode zero(std::uint32_t number, Page& page, std::size_t begin,
                                std::size_t end);

  const std::filesystem::path database_;
  sqlite3_file* file_ = nullptr;  // of the connection, during a step
  std::uint32_t pageBytes_ = 0;
  std::uint32_t pages_ = 0;
  std::uint32_t next_ = 1;  // the page to clean next
  int pass_ = 0;
  Page map_;  // the page of the page map that was read last
  std::uint32_t mapNumber_ = 0;
};

}  // namespace halvox::platform::linux_
