#include "platform/linux/store/reading/StoreReader.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>

#include <sys/stat.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/BlockScan.h"
#include "platform/linux/store/reading/EventScan.h"
#include "platform/linux/store/reading/RecordScan.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::chrono::milliseconds kBusyTimeout{1000};

// Returns a URI that makes SQLite read only the file itself, without its log and without locks.
std::string immutableURI(const std::string& path) {
  std::string uri = "file:";
  for (const char character : path) {
    if (character == '?' || character == '#' || character == '%') {
      char escaped[4];
      std::snprintf(escaped, sizeof escaped, "%%%02X", static_cast<unsigned>(character));
      uri += escaped;
    } else {
      uri += character;
    }
  }
  return uri + "?immutable=1";
}

bool isOver(const RecordFilter& filter) { return filter.isEnough && filter.isEnough(); }

}  // namespace

Result<void, StoreError> StoreReader::open(const std::filesystem::path& directory) {
  database_.close();
  files_.emplace(directory);
  identity_.reset();
  struct stat status {};
  if (::stat(files_->database().c_str(), &status) != 0) {
    const auto kind =
        errno == ENOENT || errno == ENOTDIR ? StoreError::kMissing : StoreError::kCannotOpen;
    return Failure<StoreError>{kind, files_->database().native() + ": " + errnoText(errno)};
  }
  // Refuse other files before opening them: opening a pipe would block until a program opens it for
  // writing.
  if (!S_ISREG(status.st_mode)) {
    return Failure<StoreError>{
        StoreError::kCannotOpen,
        files_->database().native() +
            ": expected a regular file, found a directory, a pipe or a device"};
  }
  auto opened = openDatabase();
  if (opened) {
    // `status` was read before the file was opened. If another file has got the name since,
    // isReplaced() returns true.
    identity_ = FileIdentity{status.st_dev, status.st_ino};
  } else {
    database_.close();
  }
  return opened;
}

Result<void, StoreError> StoreReader::openDatabase() {
  const SqliteCode code = openFile();
  if (code != SQLITE_OK) return failure(code);
  const auto version = database_.queryInteger("PRAGMA user_version");
  if (!version.has_value()) return failure(sqlite3_extended_errcode(database_.get()));
  const std::string& path = files_->database().native();
  // A service that has just started may have created the file but no table yet.
  if (*version == 0) {
    return Failure<StoreError>{StoreError::kMissing, path + ": nothing has been stored yet"};
  }
  if (*version <= kStoreSchemaVersion) return {};
  return Failure<StoreError>{StoreError::kNewerVersion,
                             path + ": expected a database of version " +
                                 std::to_string(kStoreSchemaVersion) + " or older, found version " +
                                 std::to_string(*version) + ", made by a newer release"};
}

SqliteCode StoreReader::openFile() {
  const auto attempt = [this](const std::string& file) {
    SqliteCode code = database_.open(file, DatabaseAccess::kReadOnly);
    if (code != SQLITE_OK) return code;
    sqlite3_busy_timeout(database_.get(), static_cast<int>(kBusyTimeout.count()));
    // SQLite reads the file only when a statement needs it. This statement shows whether SQLite can
    // read it.
    return database_.execute("PRAGMA schema_version");
  };
  const std::string& path = files_->database().native();
  const SqliteCode code = attempt(path);
  // Reading a WAL database needs its -shm file, which a user with only the right to read cannot
  // create. Such a user can still read a database that was closed properly, because without a log
  // the file itself is complete.
  // The low byte is the primary code; the other bits give details.
  const bool needsLog = (code & 0xFF) == SQLITE_CANTOPEN || (code & 0xFF) == SQLITE_READONLY;
  return needsLog && files_->logBytes() == 0 ? attempt(immutableURI(path)) : code;
}

template <typename ReadOld, typename Deliver>
Result<void, StoreError> StoreReader::forEachMessage(BlockRecordKind kind,
                                                     const RecordFilter& filter, ReadOld old,
                                                     Deliver deliver) {
  // Read the version at each call. A service may have migrated the store since it was opened.
  const auto version = database_.queryInteger("PRAGMA user_version");
  if (!version.has_value()) return failure(sqlite3_extended_errcode(database_.get()));
  lastRead_ = 0;
  hasGap_ = false;
  if (*version < kBlocksSinceVersion) return outcome(old(filter, *version));
  BlockScan blocks(database_, kind, filter);
  SqliteCode code = blocks.begin();
  if (blocks.isDamaged()) return damagedBlock(blocks.id());
  const auto readOld = [&] {
    if (code != SQLITE_OK || (filter.newest.has_value() && blocks.missing() == 0)) return;
    RecordFilter rest = filter;
    if (filter.newest.has_value()) rest.newest = blocks.missing();
    code = old(rest, *version);
  };
  const bool isReversed = filter.order == RecordOrder::kNewestFirst;
  if (!isReversed) readOld();
  if (code == SQLITE_OK && !isOver(filter)) code = readBlocks(blocks, filter, deliver);
  if (blocks.isDamaged()) return damagedBlock(blocks.id());
  if (isReversed && !isOver(filter)) readOld();
  if (code != SQLITE_OK) return failure(code);
  // lastRead_ is that of the old tables here. Between their numbers and those of blocks is a gap.
  hasGap_ = blocks.hasGap() && lastRead_ <= filter.after;
  lastRead_ = std::max(lastRead_, blocks.last());
  return {};
}

template <typename Deliver>
SqliteCode StoreReader::readBlocks(BlockScan& blocks, const RecordFilter& filter, Deliver deliver) {
  const bool isReversed = filter.order == RecordOrder::kNewestFirst;
  for (bool found = false;;) {
    const SqliteCode code = isReversed ? blocks.previousBlock(found) : blocks.nextBlock(found);
    if (code != SQLITE_OK || !found) return code;
    while (isReversed ? blocks.previousRecord() : blocks.nextRecord()) {
      deliver(blocks.id(), blocks.record());
      if (isOver(filter)) return SQLITE_OK;
    }
    if (blocks.isDamaged()) return SQLITE_CORRUPT;
  }
}

Result<void, StoreError> StoreReader::forEachEvent(const RecordFilter& filter,
                                                   const EventCallback& callback) {
  if (!database_.isOpen()) return Failure<StoreError>{StoreError::kMissing, "no store is open"};
  return forEachMessage(
      BlockRecordKind::kEvent, filter,
      [&](const RecordFilter& before, std::int64_t /*version*/) {
        return readOldEvents(before, callback);
      },
      [&](StoredRecordID id, const BlockRecord& record) {
        callback({id, record.time, record.name, record.payload, record.application});
      });
}

SqliteCode StoreReader::readOldEvents(const RecordFilter& filter, const EventCallback& callback) {
  EventScan scan(database_, filter);
  SqliteCode code = scan.begin();
  EventScan::Piece piece;
  while (code == SQLITE_OK && !scan.isAtEnd()) {
    code = scan.next(piece);
    for (const EventScan::Event& event : piece.events) {
      callback({event.id, event.time, scan.nameOf(event.nameID), piece.payloads[event.payload]});
      if (isOver(filter)) return SQLITE_OK;
    }
  }
  // For an empty table last() is 1, which is also the number of the first record in a block.
  if (code == SQLITE_OK && scan.last() > 1) lastRead_ = scan.last();
  return code;
}

Result<void, StoreError> StoreReader::forEachRecord(const RecordTable& table,
                                                    const RecordFilter& filter,
                                                    const RecordCallback& callback) {
  if (!database_.isOpen()) return Failure<StoreError>{StoreError::kMissing, "no store is open"};
  // If an older service made the store, it may lack the table and has no such records then.
  const auto rows = [&](const RecordFilter& before, std::int64_t version) {
    return version < table.sinceVersion ? SQLITE_OK : readRows(table, before, callback);
  };
  if (&table == &kLinkMessages) {
    return forEachMessage(
        BlockRecordKind::kLink, filter, rows,
        [&](StoredRecordID id, const BlockRecord& record) { callback(linkRecord(id, record)); });
  }
  // Read the version at each call. A service may have migrated the store since it was opened.
  const auto version = database_.queryInteger("PRAGMA user_version");
  if (!version.has_value()) return failure(sqlite3_extended_errcode(database_.get()));
  lastRead_ = 0;
  hasGap_ = false;
  return outcome(rows(filter, *version));
}

SqliteCode StoreReader::readRows(const RecordTable& table, const RecordFilter& filter,
                                 const RecordCallback& callback) {
  RecordScan scan(database_, table, filter);
  SqliteCode code = scan.begin();
  std::vector<StoredRecord> piece;
  while (code == SQLITE_OK && !scan.isAtEnd()) {
    code = scan.next(piece);
    for (const StoredRecord& record : piece) {
      callback(record);
      if (isOver(filter)) return SQLITE_OK;
    }
  }
  if (code == SQLITE_OK) lastRead_ = scan.last();
  return code;
}

Result<void, StoreError> StoreReader::outcome(SqliteCode code) const {
  if (code != SQLITE_OK) return failure(code);
  return {};
}

Failure<StoreError> StoreReader::damagedBlock(StoredRecordID after) const {
  return {StoreError::kDamaged, files_->database().native() +
                                    ": the database is damaged: the block of message " +
                                    std::to_string(after) + " cannot be unpacked"};
}

bool StoreReader::isReplaced() const {
  return !database_.isOpen() || files_->identity() != identity_;
}

Failure<StoreError> StoreReader::failure(SqliteCode code) const {
  const bool damaged = meansDamage(code);
  return {damaged ? StoreError::kDamaged : StoreError::kCannotOpen,
          files_->database().native() +
              (damaged ? ": the database is damaged: " : ": cannot read the database: ") +
              database_.errorText()};
}

}  // namespace halvox::platform::linux_
