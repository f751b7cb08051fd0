#include "platform/linux/store/spool/SpooledMessages.h"

#include <algorithm>
#include <span>
#include <string>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "SpooledMessages"};
constexpr std::string_view kPiece = "link spool";

std::size_t bytesOf(const SpooledMessage& message) {
  return message.subject.size() + message.identifier.size() + message.body.size();
}

}  // namespace

SpooledMessages::SpooledMessages(WriterQueue& queue, StatisticsService& statistics,
                                 const ClockService& clock, std::uint64_t longestMessage)
    : queue_(queue),
      clock_(clock),
      longestMessage_(longestMessage),
      counters_(statistics, kPiece),
      droppedForSize_(statistics.counter(kPiece, "dropped: store full")),
      droppedForAge_(statistics.counter(kPiece, "dropped: too old")) {}

SpooledMessages::Number SpooledMessages::append(SpooledMessage message) {
  counters_.addReceived();
  Number number = 0;
  // The number is given under the lock of the queue. The numbers therefore have the order in which
  // the messages are stored.
  const bool added = queue_.add([&] {
    number = lastAppended_.load() + 1;
    queued_.push_back({number, std::move(message)});
    lastAppended_.store(number);
  });
  if (added) return number;
  counters_.addDropped(DropReason::kClosed, 1);
  return 0;
}

void SpooledMessages::removeThrough(Number number) {
  removeThrough_.store(number);
  queue_.requestRound();
}

SqliteCode SpooledMessages::prepare(Database& database) {
  for (const auto& [statement, sql] :
       {std::pair<Statement*, std::string_view>{
            &insert_, "INSERT INTO link_spool VALUES (?1, ?2, 0, ?3, ?4)"},
        {&removeSent_, "DELETE FROM link_spool WHERE first <= ?1 AND first + messages - 1 <= ?1"},
        {&markSent_,
         "UPDATE link_spool SET sent = ?1 - first + 1"
         " WHERE first <= ?1 AND first + messages - 1 > ?1"}}) {
    const SqliteCode code = database.prepare(sql, *statement);
    if (code != SQLITE_OK) return code;
  }
  if (const SqliteCode code = table_.prepare(database); code != SQLITE_OK) return code;
  const std::int64_t last =
      database.queryInteger("SELECT ifnull(max(first + messages - 1), 0) FROM link_spool")
          .value_or(0);
  // The first open() happens before any message is appended. After that, only the numbers of this
  // run count: a database that has taken the place of another may be empty.
  if (lastAppended_.load() != 0) return SQLITE_OK;
  lastSettled_.store(static_cast<Number>(last));
  lastAppended_.store(static_cast<Number>(last));
  return SQLITE_OK;
}

void SpooledMessages::release() {
  insert_ = {};
  removeSent_ = {};
  markSent_ = {};
  table_.release();
}

void SpooledMessages::takeQueued() {
  taken_.swap(queued_);
  next_ = 0;
}

bool SpooledMessages::hasTaken() const {
  // Messages may be forgotten before they are stored. They are removed after that.
  return next_ < taken_.size() || removed_ < std::min(removeThrough_.load(), lastSettled_.load());
}

SqliteCode SpooledMessages::write(TransactionAllowance& allowance) {
  while (next_ < taken_.size() && !allowance.isUsedUp()) {
    const SqliteCode code = writeRow(allowance);
    if (code != SQLITE_OK) return code;
  }
  return writeRemoval();
}

// Writes the next messages as one row. Their numbers are consecutive; only messages that are too
// large are left out, and end a row.
SqliteCode SpooledMessages::writeRow(TransactionAllowance& allowance) {
  const Number first = taken_[next_].number;
  while (next_ < taken_.size() && row_.hasRoom()) {
    const std::size_t bytes = bytesOf(taken_[next_].message);
    const bool isTooLarge = bytes > longestMessage_;
    if (isTooLarge && row_.messages() > 0) break;
    // Free each message when it has been copied. Memory then shrinks while a long queue is written.
    const SpooledMessage message = std::exchange(taken_[next_].message, {});
    ++next_;
    ++written_;
    writtenBytes_ += bytes;
    --allowance.records;
    allowance.payloadBytes -= static_cast<std::int64_t>(bytes);
    if (isTooLarge) {
      ++tooLarge_;
      return SQLITE_OK;
    }
    row_.add(message);
  }
  const auto messages = static_cast<std::int64_t>(row_.messages());
  const std::optional<std::string_view> packed = row_.finish();
  if (!packed) return SQLITE_NOMEM;
  insert_.bind(1, static_cast<std::int64_t>(first));
  insert_.bind(2, messages);
  insert_.bind(3, clock_.currentDate().secondsSince1970);
  insert_.bind(4, std::as_bytes(std::span(packed->data(), packed->size())));
  return insert_.run();
}

SqliteCode SpooledMessages::writeRemoval() {
  const Number written = next_ > 0 ? taken_[next_ - 1].number : lastSettled_.load();
  const Number through = std::min(removeThrough_.load(), written);
  if (through <= removed_) return SQLITE_OK;
  removedNow_ = through;
  for (Statement* const statement : {&removeSent_, &markSent_}) {
    statement->bind(1, static_cast<std::int64_t>(through));
    const SqliteCode code = statement->run();
    if (code != SQLITE_OK) return code;
  }
  return SQLITE_OK;
}

void SpooledMessages::onCommitted(FinishedRecords& finished) {
  counters_.addStored(written_ - tooLarge_);
  if (removedNow_) removed_ = *removedNow_;
  canKeep_.store(true);
  endTransaction(finished);
}

std::uint64_t SpooledMessages::dropTaken(DropReason reason, FinishedRecords& finished) {
  const std::uint64_t unwritten = taken_.size() - next_;
  const std::uint64_t dropped = written_ - tooLarge_ + unwritten;
  counters_.addDropped(reason, dropped);
  next_ = taken_.size();
  canKeep_.store(false);
  row_.release();
  endTransaction(finished);
  finished.unwritten += unwritten;
  return dropped;
}

void SpooledMessages::endTransaction(FinishedRecords& finished) {
  const bool hasWritten = next_ > 0;
  if (hasWritten) settleThrough(taken_[next_ - 1].number);
  if (tooLarge_ > 0) {
    counters_.addDropped(DropReason::kTooLarge, tooLarge_);
    if (dropLines_.tryPass()) {
      kLog.error("dropped a message of the link: it is longer than ", longestMessage_, " bytes");
    }
  }
  finished.written += written_;
  finished.writtenBytes += writtenBytes_;
  written_ = writtenBytes_ = tooLarge_ = 0;
  removedNow_.reset();
  if (next_ < taken_.size()) return;
  taken_ = {};
  next_ = 0;
  if (hasWritten) row_.release();
}

void SpooledMessages::settleThrough(Number number) {
  if (number <= lastSettled_.load()) return;
  lastSettled_.store(number);
  if (stored_) stored_();
}

SqliteCode SpooledMessages::oldestTime(std::optional<double>& time) {
  std::optional<SpoolTable::Row> row;
  const SqliteCode code = table_.readOldest(row);
  time = row ? std::optional(row->time) : std::nullopt;
  return code;
}

SqliteCode SpooledMessages::deleteOldest(bool& found) {
  std::optional<SpoolTable::Row> row;
  const SqliteCode code = table_.readOldest(row);
  found = row.has_value();
  if (code != SQLITE_OK || !row) return code;
  return deleteRow(*row, droppedForSize_, "the store is full");
}

SqliteCode SpooledMessages::deleteOlderThan(double time, bool& found) {
  std::optional<SpoolTable::Row> row;
  const SqliteCode code = table_.readOldest(row);
  found = row && row->time < time;
  if (code != SQLITE_OK || !found) return code;
  return deleteRow(*row, droppedForAge_, "they are too old");
}

SqliteCode SpooledMessages::deleteRow(const SpoolTable::Row& row, Counter& counter,
                                      std::string_view why) {
  const SqliteCode code = table_.remove(row);
  if (code != SQLITE_OK) return code;
  // Messages that are removed as sent in the same transaction are not lost.
  if (row.unsent == 0) return SQLITE_OK;
  counter.add(row.unsent);
  if (dropLines_.tryPass()) {
    kLog.error("deleted ", row.unsent, " messages that no server of the link has got: ", why);
  }
  return SQLITE_OK;
}

}  // namespace halvox::platform::linux_
