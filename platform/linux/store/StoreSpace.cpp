#include "platform/linux/store/StoreSpace.h"

#include <string>
#include <system_error>

namespace halvox::platform::linux_ {
namespace {

// How many pages one step gives back. Each moved page is written to the log, and waiting records
// must not be held up for long.
constexpr int kPagesPerStep = 64;

std::uint64_t sizeOf(const std::string& file) {
  std::error_code error;
  const std::uintmax_t bytes = std::filesystem::file_size(file, error);
  return error ? 0 : bytes;
}

}  // namespace

std::uint64_t logBytes(const std::filesystem::path& database) {
  return sizeOf(database.native() + "-wal");
}

std::uint64_t bytesWithLog(const std::filesystem::path& database) {
  return sizeOf(database.native()) + logBytes(database);
}

SqliteCode giveBackPages(Database& database, bool& more) {
  more = false;
  const auto before = database.queryInteger("PRAGMA freelist_count").value_or(0);
  if (before == 0) return SQLITE_OK;
  Statement vacuum;
  SqliteCode code =
      database.prepare("PRAGMA incremental_vacuum(" + std::to_string(kPagesPerStep) + ")", vacuum);
  if (code == SQLITE_OK) code = vacuum.run();
  const auto after = database.queryInteger("PRAGMA freelist_count").value_or(0);
  // A database that another program made may be one that cannot shrink.
  more = after > 0 && after < before;
  return code;
}

SqliteCode emptyLog(Database& database, bool& isHeld) {
  const SqliteCode code = sqlite3_wal_checkpoint_v2(database.get(), nullptr,
                                                    SQLITE_CHECKPOINT_TRUNCATE, nullptr, nullptr);
  isHeld = code == SQLITE_BUSY || code == SQLITE_LOCKED;
  return isHeld ? SQLITE_OK : code;
}

}  // namespace halvox::platform::linux_
