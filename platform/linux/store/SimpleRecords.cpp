#include "platform/linux/store/SimpleRecords.h"

#include <string>

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "SimpleRecords"};

}  // namespace

SimpleRecordKind::SimpleRecordKind(const RecordTable& table, WriterQueue& queue,
                                   StatisticsService& statistics, std::uint64_t longestPayload)
    : SpannedRecordKind({.records = table.records, .spans = table.spans, .piece = table.piece},
                        queue, statistics, longestPayload),
      table_(table) {}

SqliteCode SimpleRecordKind::prepare(Database& database) {
  const SqliteCode code = spans().prepare(database);
  if (code != SQLITE_OK) return code;
  std::string sql = "INSERT INTO " + std::string(table_.records) + " VALUES (?1, ?2";
  for (std::size_t column = 0; column < table_.columns.size(); ++column) {
    sql += ", ?" + std::to_string(kFirstColumn + static_cast<int>(column));
  }
  return database.prepare(sql + ")", insert_);
}

void SimpleRecordKind::release() {
  insert_ = {};
  spans().release();
}

void SimpleRecordKind::takeQueued() {
  taken_ = takeRecords();
  next_ = 0;
}

SqliteCode SimpleRecordKind::writeNext(TransactionAllowance& allowance) {
  const Bound bound = bindRecord(next_, insert_, encoder());
  ++next_;
  if (!charge(allowance, 1, bound.bytes)) return SQLITE_OK;
  insert_.bind(1, spans().next());
  insert_.bind(2, bound.time);
  SqliteCode code = insert_.run();
  if (code == SQLITE_OK) code = spans().note(bound.time);
  spans().advance();
  return code;
}

std::uint64_t SimpleRecordKind::forgetTaken() {
  const std::uint64_t unwritten = taken_ - next_;
  forgetRecords();
  taken_ = next_ = 0;
  return unwritten;
}

void SimpleRecordKind::logTooLarge(std::uint64_t longestPayload) const {
  kLog.error("dropped a record of ", table_.piece, ": its payload is longer than ", longestPayload,
             " bytes");
}

}  // namespace halvox::platform::linux_
