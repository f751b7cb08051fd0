#pragma once

#include <cstdint>
#include <optional>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreFiles.h"

namespace halvox::platform::linux_ {

// How large the parts of a store may become, derived from the one size that its user gave.
struct StoreSizes {
  std::uint64_t databaseBytes;     // past this the oldest records go
  std::uint64_t logBytes;          // the write-ahead log is copied into the database at this size
  std::uint64_t transactionBytes;  // payloads in one transaction
  std::uint64_t payloadBytes;      // a longer one is not stored

  static StoreSizes of(std::uint32_t maxMegabytes);
};

// Opens the store's database for writing, and makes it, its directory and its tables if needed.
// A damaged one is set aside and reported with an error line, and a new one made. One of a newer
// version is left exactly as it is. Blocks on the disk, and on other users of the file for a while.
[[nodiscard]] std::optional<StoreError> openStoreDatabase(StoreFiles& files,
                                                          const StoreSizes& sizes,
                                                          Database& database);

// Closes a database without copying its write-ahead log back, so that its files stay as they are.
void abandon(Database& database);

// Whether that result means that the file's content is broken.
[[nodiscard]] bool meansDamage(SqliteCode code);

}  // namespace halvox::platform::linux_
