#include "platform/linux/store/AnalyticsRecords.h"

#include <initializer_list>
#include <string>
#include <utility>

#include "platform/linux/store/StoreLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "AnalyticsRecords"};

// Memory for this many events is kept between rounds: as many as the queue's soft limit. A burst
// that needed more gives its memory back.
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
    : SpannedRecordKind(
          {.records = "analytics_records", .spans = "analytics_spans", .piece = "analytics"}, queue,
          statistics, longestPayload),
      names_(names) {}

void AnalyticsRecords::add(double time, std::string_view name, AnalyticsPayloadBuilder builder) {
  // Look the name up outside the queue's lock, which all senders share. The look-up needs no lock.
  Event event{time, names_.find(name), nullptr, std::move(builder)};
  if (event.name == nullptr) {
    event.ownName = std::make_unique<EventName>(name, true);
    event.name = event.ownName.get();
  }
  addQueued([&] { queued_.push_back(std::move(event)); });
}

void AnalyticsRecords::takeQueued() {
  taken_.clear();
  // Free the memory before the swap: the emptied vector is the one to which events are added next.
  if (taken_.capacity() > kKeptEvents) taken_ = std::vector<Event>();
  taken_.swap(queued_);
  next_ = 0;
}

SqliteCode AnalyticsRecords::prepare(Database& database) {
  // The database may be another one than before, with other numbers for the names.
  ++generation_;
  const SqliteCode code = spans().prepare(database);
  if (code != SQLITE_OK) return code;
  return prepareAll(
      database,
      {{&statements_.insertRecord,
        "INSERT INTO analytics_records(id, time, name_id, twin_time, twin_name_id, payload)"
        " VALUES (?1, ?2, ?3, ?4, ?5, ?6)"},
       {&statements_.insertName,
        "INSERT INTO event_names(name) VALUES (?1) ON CONFLICT DO NOTHING"},
       {&statements_.findName, "SELECT id FROM event_names WHERE name = ?1"}});
}

void AnalyticsRecords::release() {
  statements_ = {};
  spans().release();
}

// Builds the payload of a taken event. Frees the builder with the message that it holds, so that
// memory shrinks while a large batch is written.
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
    // The next payload is built before this one is encoded: comparing two values is cheaper than
    // encoding both and comparing texts.
    lookedAhead_ = build(index + 1);
    hasLookedAhead_ = true;
    if (encodeAlike(payload, lookedAhead_)) twin = &taken_[index + 1];
  }
  // The payload that was built ahead is kept for the next record unless this one has used it.
  if (twin != nullptr) hasLookedAhead_ = false;
  const std::uint64_t events = twin != nullptr ? 2 : 1;
  const std::string_view text = encoder().encode(payload);

  next_ += events;
  if (!charge(allowance, events, text.size())) return SQLITE_OK;
  return insert(taken_[index], twin, text);
}

SqliteCode AnalyticsRecords::insert(const Event& event, const Event* twin,
                                    std::string_view payload) {
  SqliteCode code = identify(*event.name);
  if (code != SQLITE_OK) return code;
  Statement& statement = statements_.insertRecord;
  statement.bind(1, spans().next());
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
  code = spans().note(event.time);
  if (code == SQLITE_OK && twin != nullptr) code = spans().note(twin->time);
  spans().advance();
  return code;
}

SqliteCode AnalyticsRecords::identify(EventName& name) {
  // The usual case: the same names are used again and again.
  if (name.generation == generation_) return SQLITE_OK;
  statements_.insertName.bind(1, name.text);
  // Insert first and look up afterwards: the name may be in the database from an earlier run.
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

std::uint64_t AnalyticsRecords::forgetTaken() {
  // The rollback has removed the rows of names that were new in this transaction.
  ++generation_;
  hasLookedAhead_ = false;
  lookedAhead_ = {};
  const std::uint64_t unwritten = taken_.size() - next_;
  taken_.clear();
  next_ = 0;
  return unwritten;
}

void AnalyticsRecords::logTooLarge(std::uint64_t longestPayload) const {
  kLog.error("dropped an event whose payload is longer than ", longestPayload, " bytes");
}

}  // namespace halvox::platform::linux_
