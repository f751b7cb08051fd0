#include "platform/linux/store/spool/SqliteLinkSpool.h"

#include <string>

#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/StoreLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "SqliteLinkSpool"};
constexpr int kBusyMilliseconds = 250;

}  // namespace

SqliteCode SqliteLinkSpool::open() {
  const std::optional<FileIdentity> identity = fileIdentity(file_);
  // The store may have set its file aside and begun another one.
  if (database_.isOpen() && identity == identity_) return SQLITE_OK;
  close();
  SqliteCode code = database_.open(file_.native(), DatabaseAccess::kReadOnly);
  if (code != SQLITE_OK) return code;
  identity_ = identity;
  sqlite3_busy_timeout(database_.get(), kBusyMilliseconds);
  // A row has at most SpoolRowWriter::kMostMessages messages. The first condition therefore finds
  // the row that holds the next number without a search through all rows.
  return database_.prepare(
      "SELECT first, messages, sent, block FROM link_spool"
      " WHERE first > ?1 - " +
          std::to_string(SpoolRowWriter::kMostMessages) +
          " AND first + messages - 1 > ?1 ORDER BY first LIMIT 1",
      next_);
}

void SqliteLinkSpool::close() {
  next_ = {};
  database_.close();
}

Failure<StoreError> SqliteLinkSpool::failure() const {
  return {StoreError::kCannotOpen,
          file_.native() + ": cannot read messages of the link: " + database_.errorText()};
}

Result<LinkSpool::Read, StoreError> SqliteLinkSpool::readAfter(Number after) {
  Read read{.messages = {}, .through = after};
  if (open() != SQLITE_OK) {
    auto failed = failure();
    close();
    return failed;
  }
  next_.bind(1, static_cast<std::int64_t>(after));
  const SqliteCode code = next_.step();
  if (code == SQLITE_ROW) {
    const auto first = static_cast<Number>(next_.integer(0));
    const auto messages = static_cast<std::size_t>(next_.integer(1));
    const Number firstUnsent = first + static_cast<Number>(next_.integer(2));
    read.through = first + messages - 1;
    auto unpacked = readSpoolRow(next_.bytes(3), messages);
    if (!unpacked) {
      kLog.error(file_.c_str(), ": row ", first, " of link_spool is damaged; ", messages,
                 " messages of the link are lost");
      unpacked.emplace();
    }
    Number number = first;
    for (SpooledMessage& message : *unpacked) {
      if (number > after && number >= firstUnsent && !isErased(message)) {
        read.messages.emplace_back(number, std::move(message));
      }
      ++number;
    }
  }
  next_.reset();
  if (code == SQLITE_ROW || code == SQLITE_DONE) return read;
  auto failed = failure();
  close();
  return failed;
}

}  // namespace halvox::platform::linux_
