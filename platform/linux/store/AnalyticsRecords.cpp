#include "platform/linux/store/AnalyticsRecords.h"

#include <algorithm>
#include <iterator>
#include <string>
#include <utility>

#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "AnalyticsRecords"};

// Few, because a single step may hold large payloads.
constexpr std::int64_t kRecordsPerStep = 64;
// A burst's memory is given back; what an ordinary round needs is kept.
constexpr std::size_t kKeptEvents = 8192;

SqliteCode prepareAll(Database& database,
                      std::initializer_list<std::pair<Statement*, std::string_view>> statements) {
  for (const auto& [statement, sql] : statements) {
    const SqliteCode code = database.prepare(sql, *statement);
    if (code != SQLITE_OK) return code;
  }
  return SQLITE_OK;
}

}  // namespace

AnalyticsRecords::AnalyticsRecords(EventNames& names, WriterQueue& queue,
                                   StatisticsService& statistics, std::uint64_t longestPayload)
    : names_(names),
      queue_(queue),
      counters_(statistics, "analytics"),
      longestPayload_(longestPayload) {}

void AnalyticsRecords::add(double time, std::string_view name, AnalyticsPayloadBuilder builder) {
  Event event{time, names_.find(name), nullptr, std::move(builder)};
  if (event.name == nullptr) {
    event.ownName = std::make_unique<EventName>(name, true);
    event.name = event.ownName.get();
  }
  counters_.addReceived();
  if (!queue_.add([&] { queued_.push_back(std::move(event)); })) {
    counters_.addDropped(DropReason::kClosed, 1);
  }
}

void AnalyticsRecords::takeQueued() {
  taken_.clear();
  if (taken_.capacity() > kKeptEvents) taken_ = std::vector<Event>();
  taken_.swap(queued_);
  next_ = 0;
}

SqliteCode AnalyticsRecords::prepare(Database& database) {
  ++generation_;
  const SqliteCode code = readNextRecordID(database);
  if (code != SQLITE_OK) return code;
  return prepareAll(
      database,
      {{&statements_.insertRecord,
        "INSERT INTO analytics_records(id, time, name_id, twin_time, twin_name_id, payload)"
        " VALUES (?1, ?2, ?3, ?4, ?5, ?6)"},
       {&statements_.insertName,
        "INSERT INTO event_names(name) VALUES (?1) ON CONFLICT DO NOTHING"},
       {&statements_.findName, "SELECT id FROM event_names WHERE name = ?1"},
       {&statements_.noteSpan,
        "INSERT INTO analytics_spans VALUES (?1, ?2, ?3) ON CONFLICT(span) DO UPDATE SET"
        " first_time = min(first_time, excluded.first_time),"
        " last_time = max(last_time, excluded.last_time)"},
       {&statements_.oldestRecord, "SELECT min(id) FROM analytics_records"},
       {&statements_.deleteRecords, "DELETE FROM analytics_records WHERE id BETWEEN ?1 AND ?2"},
       // The newest span stays though its records are gone: it keeps record numbers growing.
       {&statements_.deleteEmptySpans,
        "DELETE FROM analytics_spans WHERE span < ?1"
        " AND span < (SELECT max(span) FROM analytics_spans)"},
       {&statements_.agedSpan,
        "SELECT span FROM analytics_spans WHERE first_time < ?1"
        " ORDER BY span LIMIT 1"},
       {&statements_.deleteAgedRecords,
        "DELETE FROM analytics_records WHERE id BETWEEN ?1 AND ?2 AND time < ?3"},
       {&statements_.shortenSpan,
        "UPDATE analytics_spans SET first_time = max(first_time, ?2) WHERE span = ?1"}});
}

SqliteCode AnalyticsRecords::readNextRecordID(Database& database) {
  Statement statement;
  SqliteCode code = database.prepare(
      "SELECT max(ifnull((SELECT max(id) FROM analytics_records), 0) + 1,"
      " ifnull((SELECT max(span) FROM analytics_spans), 0) * ?1)",
      statement);
  if (code != SQLITE_OK) return code;
  statement.bind(1, kRecordsPerSpan);
  code = statement.step();
  if (code != SQLITE_ROW) return code;
  nextRecordID_ = nextCommittedRecordID_ = statement.integer(0);
  return SQLITE_OK;
}

void AnalyticsRecords::release() { statements_ = {}; }

SqliteCode AnalyticsRecords::write(TransactionAllowance& allowance) {
  while (hasTaken() && !allowance.isUsedUp()) {
    const SqliteCode code = writeNext(allowance);
    if (code != SQLITE_OK) return code;
  }
  return flushSpan();
}

// Builds the payload of a taken event and lets go of its builder and all that it holds.
Dictionary AnalyticsRecords::build(std::size_t index) {
  const AnalyticsPayloadBuilder builder = std::exchange(taken_[index].builder, nullptr);
  return builder ? builder() : Dictionary();
}

SqliteCode AnalyticsRecords::writeNext(TransactionAllowance& allowance) {
  const std::size_t index = next_;
  const Dictionary payload =
      std::exchange(hasLookedAhead_, false) ? std::exchange(lookedAhead_, {}) : build(index);
  const Event* twin = nullptr;
  if (index + 1 < taken_.size()) {
    lookedAhead_ = build(index + 1);
    hasLookedAhead_ = true;
    if (encodeAlike(payload, lookedAhead_)) twin = &taken_[index + 1];
  }
  if (twin != nullptr) hasLookedAhead_ = false;
  const std::uint64_t events = twin != nullptr ? 2 : 1;
  const std::string_view text = encoder_.encode(payload);

  next_ += events;
  written_ += events;
  writtenBytes_ += text.size();
  allowance.records -= static_cast<std::int64_t>(events);
  allowance.payloadBytes -= static_cast<std::int64_t>(text.size());
  if (text.size() > longestPayload_) {
    tooLarge_ += events;
    return SQLITE_OK;
  }
  return insert(taken_[index], twin, text);
}

SqliteCode AnalyticsRecords::insert(const Event& event, const Event* twin,
                                    std::string_view payload) {
  SqliteCode code = identify(*event.name);
  if (code != SQLITE_OK) return code;
  Statement& statement = statements_.insertRecord;
  statement.bind(1, nextRecordID_);
  statement.bind(2, event.time);
  statement.bind(3, event.name->databaseID);
  if (twin != nullptr) {
    code = identify(*twin->name);
    if (code != SQLITE_OK) return code;
    statement.bind(4, twin->time);
    statement.bind(5, twin->name->databaseID);
  } else {
    statement.bindNull(4);
    statement.bindNull(5);
  }
  statement.bind(6, payload);
  code = statement.run();
  if (code != SQLITE_OK) return code;
  code = noteTime(event.time);
  if (code == SQLITE_OK && twin != nullptr) code = noteTime(twin->time);
  ++nextRecordID_;
  return code;
}

SqliteCode AnalyticsRecords::identify(EventName& name) {
  if (name.generation == generation_) return SQLITE_OK;
  statements_.insertName.bind(1, name.text);
  SqliteCode code = statements_.insertName.run();
  if (code != SQLITE_OK) return code;
  statements_.findName.bind(1, name.text);
  code = statements_.findName.step();
  if (code == SQLITE_ROW) {
    name.databaseID = statements_.findName.integer(0);
    name.generation = generation_;
  }
  statements_.findName.reset();
  return code == SQLITE_ROW ? SQLITE_OK : code;
}

SqliteCode AnalyticsRecords::noteTime(double time) {
  const std::int64_t number = nextRecordID_ / kRecordsPerSpan;
  if (number == span_.number) {
    span_.firstTime = std::min(span_.firstTime, time);
    span_.lastTime = std::max(span_.lastTime, time);
    return SQLITE_OK;
  }
  const SqliteCode code = flushSpan();
  span_ = {number, time, time};
  return code;
}

SqliteCode AnalyticsRecords::flushSpan() {
  if (span_.number < 0) return SQLITE_OK;
  Statement& statement = statements_.noteSpan;
  statement.bind(1, span_.number);
  statement.bind(2, span_.firstTime);
  statement.bind(3, span_.lastTime);
  span_ = {};
  return statement.run();
}

void AnalyticsRecords::onCommitted() {
  nextCommittedRecordID_ = nextRecordID_;
  counters_.addStored(written_ - tooLarge_);
  endTransaction();
}

void AnalyticsRecords::endTransaction() {
  if (tooLarge_ > 0) {
    counters_.addDropped(DropReason::kTooLarge, tooLarge_);
    if (tooLargeLines_.tryPass()) {
      kLog.error("dropped an event whose payload is longer than ", longestPayload_, " bytes");
    }
  }
  queue_.finish(written_, writtenBytes_);
  written_ = writtenBytes_ = tooLarge_ = 0;
}

std::uint64_t AnalyticsRecords::dropTaken(DropReason reason) {
  // Waiting for a locked file must not look like slow writing, or callers would have to wait too.
  queue_.disregardTime();
  nextRecordID_ = nextCommittedRecordID_;
  span_ = {};
  ++generation_;
  hasLookedAhead_ = false;
  lookedAhead_ = {};
  const std::uint64_t remaining = taken_.size() - next_;
  const std::uint64_t dropped = written_ - tooLarge_ + remaining;
  counters_.addDropped(reason, dropped);
  next_ = taken_.size();
  endTransaction();
  taken_.clear();
  next_ = 0;
  queue_.finish(remaining, 0);
  return dropped;
}

SqliteCode AnalyticsRecords::deleteOldest(bool& found) {
  SqliteCode code = statements_.oldestRecord.step();
  found = code == SQLITE_ROW && !statements_.oldestRecord.isNull(0);
  const std::int64_t first = found ? statements_.oldestRecord.integer(0) : 0;
  statements_.oldestRecord.reset();
  if (!found) return code == SQLITE_ROW ? SQLITE_OK : code;

  statements_.deleteRecords.bind(1, first);
  statements_.deleteRecords.bind(2, first + kRecordsPerStep - 1);
  code = statements_.deleteRecords.run();
  if (code != SQLITE_OK) return code;
  statements_.deleteEmptySpans.bind(1, (first + kRecordsPerStep) / kRecordsPerSpan);
  return statements_.deleteEmptySpans.run();
}

SqliteCode AnalyticsRecords::deleteOlderThan(double time, bool& found) {
  statements_.agedSpan.bind(1, time);
  SqliteCode code = statements_.agedSpan.step();
  found = code == SQLITE_ROW;
  const std::int64_t span = found ? statements_.agedSpan.integer(0) : 0;
  statements_.agedSpan.reset();
  if (!found) return code == SQLITE_DONE ? SQLITE_OK : code;

  statements_.deleteAgedRecords.bind(1, span * kRecordsPerSpan);
  statements_.deleteAgedRecords.bind(2, (span + 1) * kRecordsPerSpan - 1);
  statements_.deleteAgedRecords.bind(3, time);
  code = statements_.deleteAgedRecords.run();
  if (code != SQLITE_OK) return code;
  // So that the span is not found again; it goes with the records after it.
  statements_.shortenSpan.bind(1, span);
  statements_.shortenSpan.bind(2, time);
  return statements_.shortenSpan.run();
}

}  // namespace halvox::platform::linux_
