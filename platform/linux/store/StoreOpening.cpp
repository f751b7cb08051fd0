#include "platform/linux/store/StoreOpening.h"

#include <algorithm>
#include <string>

#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "StoreOpening"};

constexpr std::uint64_t kMegabyte = 1024U * 1024U;
// With pages of 8,192 bytes a message costs 3.6 us of CPU, because fewer pages are written than
// with 4,096 bytes, where it costs 4.3 us. With 16,384 bytes it costs 3.5 us, but the commit of a
// single message, which writes two or three pages, becomes larger.
constexpr std::uint64_t kPageBytes = 8192;
constexpr std::uint64_t kCacheKibibytes = 1024;
constexpr std::uint64_t kLargestLog = 4 * kMegabyte;
// Readers see a record after the commit of its transaction. This size bounds the time until then.
constexpr std::uint64_t kLargestTransaction = 2 * kMegabyte;
// Must be less than the 1,000,000,000 bytes that SQLite accepts for one value.
constexpr std::uint64_t kLargestPayload = 256 * kMegabyte;

Failure<StoreError> failure(StoreError code, const StoreFiles& files, const std::string& what) {
  return {code, files.database().native() + ": " + what};
}

Failure<StoreError> judged(SqliteCode code, const StoreFiles& files, const Database& database) {
  return failure(meansDamage(code) ? StoreError::kDamaged : StoreError::kCannotOpen, files,
                 "cannot open the database: " + database.errorText());
}

std::string pragmas(const StoreSizes& sizes) {
  // The first two settings must precede the first table, because for an existing file SQLite
  // applies them only in a full VACUUM. Deleted records leave free pages, which later records fill.
  // The page map that incremental vacuum needs has no measurable cost, and the file can shrink
  // after its limit was lowered. With WAL and NORMAL, only a power cut can lose committed records;
  // killing the process cannot.
  return "PRAGMA page_size = " + std::to_string(kPageBytes) +
         "; PRAGMA auto_vacuum = INCREMENTAL"
         "; PRAGMA journal_mode = WAL; PRAGMA synchronous = NORMAL"
         "; PRAGMA wal_autocheckpoint = " +
         std::to_string(sizes.logBytes / kPageBytes) +
         "; PRAGMA journal_size_limit = " + std::to_string(sizes.logBytes) +
         "; PRAGMA cache_size = -" + std::to_string(kCacheKibibytes) +
         // Debian builds SQLite with secure_delete enabled, which would overwrite deleted records
         // with zeros.
         "; PRAGMA secure_delete = OFF; PRAGMA temp_store = MEMORY";
}

// Opens the file and reads its version without changing it, because a database of a newer version
// must stay as it is.
Result<void, StoreError> examine(const StoreFiles& files, Database& database) {
  SqliteCode code = database.open(files.database(), DatabaseAccess::kReadWrite);
  if (code != SQLITE_OK) return judged(code, files, database);
  // Set the time-out before the first statement, because another program may hold a lock while the
  // service starts.
  sqlite3_busy_timeout(database.get(), static_cast<int>(kWriterBusyTimeout.count()));
  // Read the first page. This detects a file that is not a database before anything changes it.
  code = database.execute("PRAGMA schema_version");
  if (code != SQLITE_OK) return judged(code, files, database);
  const auto version = database.queryInteger("PRAGMA user_version");
  if (!version.has_value()) {
    return judged(sqlite3_extended_errcode(database.get()), files, database);
  }
  if (*version > kStoreSchemaVersion) {
    return failure(StoreError::kNewerVersion, files,
                   "expected a database of version " + std::to_string(kStoreSchemaVersion) +
                       " or older, found version " + std::to_string(*version) +
                       ", made by a newer release");
  }
  // If SQLite cannot write to a file, it opens the file for reading only, without an error.
  if (sqlite3_db_readonly(database.get(), "main") == 1) {
    return failure(StoreError::kDirectory, files, "cannot write to the database file");
  }
  return {};
}

// Opens the file and migrates the database. After a failure the database is not open.
Result<void, StoreError> attempt(const StoreFiles& files, const StoreSizes& sizes,
                                 Database& database) {
  auto opened = examine(files, database);
  if (opened) {
    SqliteCode code = database.execute(pragmas(sizes));
    if (code == SQLITE_OK) code = migrate(database);
    if (code != SQLITE_OK) opened = judged(code, files, database);
  }
  if (!opened) abandon(database);
  return opened;
}

}  // namespace

StoreSizes StoreSizes::of(std::uint32_t maxMegabytes) {
  const std::uint64_t all = std::max<std::uint64_t>(maxMegabytes, 1) * kMegabyte;
  const std::uint64_t log = std::min(kLargestLog, all / 8);
  const std::uint64_t transaction = std::min(kLargestTransaction, all / 8);
  // The log exceeds its size by the transaction that fills it. Reserve twice the size of that
  // transaction's payloads, because SQLite writes whole pages.
  return {.databaseBytes = all - log - 2 * transaction,
          .logBytes = log,
          .transactionBytes = transaction,
          .payloadBytes = std::min(kLargestPayload, all / 4)};
}

bool meansDamage(SqliteCode code) {
  const int primary = code & 0xFF;
  return primary == SQLITE_CORRUPT || primary == SQLITE_NOTADB;
}

void abandon(Database& database) {
  if (!database.isOpen()) return;
  sqlite3_db_config(database.get(), SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
  database.close();
}

Result<void, StoreError> openIntactDatabase(StoreFiles& files, const StoreSizes& sizes,
                                            Database& database) {
  if (auto claimed = files.claimDirectory(); !claimed) return claimed;
  return attempt(files, sizes, database);
}

Result<void, StoreError> openStoreDatabase(StoreFiles& files, const StoreSizes& sizes,
                                           Database& database) {
  if (auto claimed = files.claimDirectory(); !claimed) return claimed;
  if (auto made = files.makeDatabaseFile(); !made) return made;
  auto opened = attempt(files, sizes, database);
  if (opened || opened.error().code != StoreError::kDamaged) return opened;

  const auto newName = files.setAside();
  if (!newName) return newName.error();
  kLog.error("the database is damaged: ", opened.error().message, "; it was set aside as ",
             *newName, ", and an empty database takes its place");
  if (auto made = files.makeDatabaseFile(); !made) return made;
  return attempt(files, sizes, database);
}

}  // namespace halvox::platform::linux_
