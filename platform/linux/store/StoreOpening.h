#pragma once

#include <chrono>
#include <cstdint>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreFiles.h"

namespace halvox::platform::linux_ {

// How long the writer waits for a lock of another process before it drops the records being
// written. This is half of the time (500 ms) within which readers must see a record.
constexpr std::chrono::milliseconds kWriterBusyTimeout{250};

// How large the parts of a store may become. All sizes derive from the size in the configuration.
struct StoreSizes {
  std::uint64_t databaseBytes;     // above this size the oldest records are deleted
  std::uint64_t logBytes;          // at this size the write-ahead log is copied into the database
  std::uint64_t transactionBytes;  // the most payload in one transaction
  std::uint64_t payloadBytes;      // the longest payload; longer ones are dropped and counted

  static StoreSizes of(std::uint32_t maxMegabytes);
};

// Opens the store's database for writing. Creates the directory, the file and the tables that are
// missing, and migrates an older schema. Reads only the first pages, however large the file is. If
// they show damage, renames the database, logs an error and creates an empty one. If a newer
// version made the database, leaves it unchanged and returns an error.
//
// Blocks on the disk, and up to 250 ms for each lock that another process holds. `files` and
// `database` belong to the caller.
Result<void, StoreError> openStoreDatabase(StoreFiles& files, const StoreSizes& sizes,
                                           Database& database);

// Opens the database of a store that exists, as openStoreDatabase() does, but leaves a damaged one
// as it is and fails with kDamaged.
Result<void, StoreError> openIntactDatabase(StoreFiles& files, const StoreSizes& sizes,
                                            Database& database);

// Closes a database without copying its write-ahead log into it. Damaged files therefore stay as
// they are and can be examined. Does nothing if the database is not open.
void abandon(Database& database);

// Returns true if the code means that the content of the file is damaged.
[[nodiscard]] bool meansDamage(SqliteCode code);

}  // namespace halvox::platform::linux_
