#include "platform/linux/store/SimpleRecords.h"

#include <string>

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "SimpleRecords"};

}  // namespace

SimpleRecordKind::SimpleRecordKind(const RecordTable& table, WriterQueue& queue,
                                   StatisticsService& statistics, std::uint64_t longestPayload)
    : table_(table),
      queue_(queue),
      counters_(statistics, table.piece),
      longestPayload_(longestPayload),
      spans_(table.records, table.spans) {}

SqliteCode SimpleRecordKind::prepare(Database& database) {
  const SqliteCode code = spans_.prepare(database);
  if (code != SQLITE_OK) return code;
  std::string sql = "INSERT INTO " + std::string(table_.records) + " VALUES (?1, ?2";
  for (std::size_t column = 0; column < table_.columns.size(); ++column) {
    sql += ", ?" + std::to_string(kFirstColumn + static_cast<int>(column));
  }
  return database.prepare(sql + ")", insert_);
}

void SimpleRecordKind::release() {
  insert_ = {};
  spans_.release();
}

void SimpleRecordKind::takeQueued() {
  taken_ = takeRecords();
  next_ = 0;
}

SqliteCode SimpleRecordKind::write(TransactionAllowance& allowance) {
  while (hasTaken() && !allowance.isUsedUp()) {
    const SqliteCode code = writeNext(allowance);
    if (code != SQLITE_OK) return code;
  }
  return spans_.flush();
}

SqliteCode SimpleRecordKind::writeNext(TransactionAllowance& allowance) {
  const Bound bound = bindRecord(next_, insert_, encoder_);
  ++next_;
  ++written_;
  writtenBytes_ += bound.bytes;
  --allowance.records;
  allowance.payloadBytes -= static_cast<std::int64_t>(bound.bytes);
  // The record is counted as written although it is not stored: the queue must know that it is
  // gone.
  if (bound.bytes > longestPayload_) {
    ++tooLarge_;
    return SQLITE_OK;
  }
  insert_.bind(1, spans_.next());
  insert_.bind(2, bound.time);
  SqliteCode code = insert_.run();
  if (code == SQLITE_OK) code = spans_.note(bound.time);
  spans_.advance();
  return code;
}

void SimpleRecordKind::onCommitted(FinishedRecords& finished) {
  spans_.onCommitted();
  counters_.addStored(written_ - tooLarge_);
  endTransaction(finished);
}

void SimpleRecordKind::endTransaction(FinishedRecords& finished) {
  if (tooLarge_ > 0) {
    counters_.addDropped(DropReason::kTooLarge, tooLarge_);
    if (tooLargeLines_.tryPass()) {
      kLog.error("dropped a record of ", table_.piece, ": its payload is longer than ",
                 longestPayload_, " bytes");
    }
  }
  finished.written += written_;
  finished.writtenBytes += writtenBytes_;
  written_ = writtenBytes_ = tooLarge_ = 0;
}

std::uint64_t SimpleRecordKind::dropTaken(DropReason reason, FinishedRecords& finished) {
  spans_.onRolledBack();
  const std::uint64_t unwritten = taken_ - next_;
  const std::uint64_t dropped = written_ - tooLarge_ + unwritten;
  counters_.addDropped(reason, dropped);
  endTransaction(finished);
  finished.unwritten += unwritten;
  forgetRecords();
  taken_ = next_ = 0;
  return dropped;
}

}  // namespace halvox::platform::linux_
