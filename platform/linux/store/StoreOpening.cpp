#include "platform/linux/store/StoreOpening.h"

#include <algorithm>
#include <chrono>
#include <string>

#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "StoreOpening"};

constexpr std::uint64_t kMegabyte = 1024U * 1024U;
// With pages of this size a message costs a sixth less processor time than with 4,096 bytes,
// because fewer are written, and a commit of a single message still writes but two or three.
constexpr std::uint64_t kPageBytes = 8192;
constexpr std::uint64_t kCacheKibibytes = 1024;
constexpr std::uint64_t kLargestLog = 4 * kMegabyte;
constexpr std::uint64_t kLargestTransaction = 2 * kMegabyte;
constexpr std::uint64_t kLargestPayload = 256 * kMegabyte;
constexpr std::chrono::milliseconds kBusyTimeout{250};
// A check of this length reads more than a gigabyte; what it does not reach shows when it is used.
constexpr std::chrono::seconds kCheckTime{2};
constexpr int kCheckSteps = 10'000;

using Deadline = std::chrono::steady_clock::time_point;

StoreError failure(StoreError::Kind kind, const StoreFiles& files, const std::string& what) {
  return {kind, files.database().native() + ": " + what};
}

// What an attempt at opening came to; `reason` says why when it is neither.
struct Attempt {
  enum class Outcome : std::uint8_t { kOpened, kDamaged, kFailed };
  Outcome outcome;
  StoreError reason{};
};

Attempt judged(SqliteCode code, const StoreFiles& files, const Database& database) {
  return {meansDamage(code) ? Attempt::Outcome::kDamaged : Attempt::Outcome::kFailed,
          failure(StoreError::Kind::kCannotOpen, files,
                  "the database cannot be opened: " + database.errorText())};
}

std::string pragmas(const StoreSizes& sizes) {
  // Deleted records leave free pages, which later records fill again; the page map of incremental
  // vacuum costs nothing that can be measured and lets the file shrink when its limit is lowered.
  return "PRAGMA page_size = " + std::to_string(kPageBytes) +
         "; PRAGMA auto_vacuum = INCREMENTAL"
         "; PRAGMA journal_mode = WAL; PRAGMA synchronous = NORMAL"
         "; PRAGMA wal_autocheckpoint = " +
         std::to_string(sizes.logBytes / kPageBytes) +
         "; PRAGMA journal_size_limit = " + std::to_string(sizes.logBytes) +
         "; PRAGMA cache_size = -" + std::to_string(kCacheKibibytes) +
         "; PRAGMA secure_delete = OFF; PRAGMA temp_store = MEMORY";
}

// SQLITE_OK for a sound file or one that was sound as far as the time allowed.
SqliteCode check(Database& database, std::string& finding) {
  Deadline deadline = std::chrono::steady_clock::now() + kCheckTime;
  sqlite3_progress_handler(
      database.get(), kCheckSteps,
      [](void* limit) {
        return static_cast<int>(std::chrono::steady_clock::now() > *static_cast<Deadline*>(limit));
      },
      &deadline);
  Statement statement;
  SqliteCode code = database.prepare("PRAGMA quick_check(1)", statement);
  if (code == SQLITE_OK) code = statement.step();
  if (code == SQLITE_ROW) finding = statement.text(0);
  std::ranges::replace(finding, '\n', ' ');
  sqlite3_progress_handler(database.get(), 0, nullptr, nullptr);
  if (code == SQLITE_INTERRUPT) return SQLITE_OK;
  if (code != SQLITE_ROW) return code;
  return finding == "ok" ? SQLITE_OK : SQLITE_CORRUPT;
}

// Reads the version before anything is changed.
Attempt examine(const StoreFiles& files, Database& database) {
  SqliteCode code = database.open(files.database(), DatabaseAccess::kReadWrite);
  if (code != SQLITE_OK) return judged(code, files, database);
  sqlite3_busy_timeout(database.get(), static_cast<int>(kBusyTimeout.count()));
  code = database.execute("PRAGMA schema_version");
  if (code != SQLITE_OK) return judged(code, files, database);
  const auto version = database.queryInteger("PRAGMA user_version");
  if (!version.has_value()) {
    return judged(sqlite3_extended_errcode(database.get()), files, database);
  }
  if (*version > kStoreSchemaVersion) {
    return {
        Attempt::Outcome::kFailed,
        failure(StoreError::Kind::kNewerVersion, files,
                "the database has version " + std::to_string(*version) +
                    ", this program knows versions up to " + std::to_string(kStoreSchemaVersion))};
  }
  if (sqlite3_db_readonly(database.get(), "main") == 1) {
    return {Attempt::Outcome::kFailed,
            failure(StoreError::Kind::kDirectory, files, "the file cannot be written")};
  }
  std::string finding;
  code = check(database, finding);
  if (code == SQLITE_OK) return {Attempt::Outcome::kOpened};
  Attempt result = judged(code, files, database);
  if (!finding.empty()) result.reason.description = files.database().native() + ": " + finding;
  return result;
}

Attempt attempt(const StoreFiles& files, const StoreSizes& sizes, Database& database) {
  Attempt result = examine(files, database);
  if (result.outcome != Attempt::Outcome::kOpened) return result;
  SqliteCode code = database.execute(pragmas(sizes));
  if (code == SQLITE_OK) code = migrate(database);
  return code == SQLITE_OK ? result : judged(code, files, database);
}

}  // namespace

StoreSizes StoreSizes::of(std::uint32_t maxMegabytes) {
  const std::uint64_t all = std::max<std::uint64_t>(maxMegabytes, 1) * kMegabyte;
  const std::uint64_t log = std::min(kLargestLog, all / 8);
  const std::uint64_t transaction = std::min(kLargestTransaction, all / 8);
  // The log grows past its size by the transaction that fills it.
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

std::optional<StoreError> openStoreDatabase(StoreFiles& files, const StoreSizes& sizes,
                                            Database& database) {
  if (auto error = files.claimDirectory()) return error;
  if (auto error = files.makeDatabaseFile()) return error;
  Attempt result = attempt(files, sizes, database);
  if (result.outcome == Attempt::Outcome::kOpened) return std::nullopt;
  abandon(database);
  if (result.outcome == Attempt::Outcome::kFailed) return result.reason;

  std::string newName;
  if (auto error = files.setAside(newName)) return error;
  kLog.error("the database is damaged and was set aside as ", newName,
             ", a new one is begun: ", result.reason.description);
  if (auto error = files.makeDatabaseFile()) return error;
  result = attempt(files, sizes, database);
  if (result.outcome == Attempt::Outcome::kOpened) return std::nullopt;
  abandon(database);
  return result.reason;
}

}  // namespace halvox::platform::linux_
