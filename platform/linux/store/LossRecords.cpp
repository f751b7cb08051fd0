#include "platform/linux/store/LossRecords.h"

#include <string_view>
#include <utility>

#include "platform/counter_kinds.h"
#include "platform/linux/store/RecordTables.h"

namespace halvox::platform::linux_ {

LossRecords::LossRecords(StatisticsService& statistics, const ClockService& clock)
    : KindWithSpans(kLosses.records, kLosses.spans),
      statistics_(statistics),
      clock_(clock),
      lastTime_(clock.currentDate().secondsSince1970) {}

SqliteCode LossRecords::prepare(Database& database) {
  const SqliteCode code = spans().prepare(database);
  if (code != SQLITE_OK) return code;
  return database.prepare("INSERT INTO loss_records VALUES (?1, ?2, ?3, ?4, ?5)", insert_);
}

void LossRecords::release() {
  insert_ = {};
  spans().release();
}

void LossRecords::finish() { isFinishing_ = !grown().empty(); }

// Also due when the clock was set back, or else nothing would be recorded until it has caught up.
bool LossRecords::isDue(double now) const {
  return isFinishing_ || now < lastTime_ || now - lastTime_ >= kSecondsBetween;
}

std::vector<LossRecords::Loss> LossRecords::grown() const {
  std::vector<Loss> losses;
  statistics_.forEachCounter(
      [&](std::string_view piece, std::string_view name, std::uint64_t total) {
        if (total == 0 || !isLoss(name)) return;
        Loss loss{.name = {std::string(piece), std::string(name)}, .total = total};
        const auto found = recorded_.find(loss.name);
        loss.count = total - (found == recorded_.end() ? 0 : found->second);
        if (loss.count > 0) losses.push_back(std::move(loss));
      });
  return losses;
}

SqliteCode LossRecords::write(TransactionAllowance& /*allowance*/) {
  const double now = clock_.currentDate().secondsSince1970;
  if (writtenAt_ || !isDue(now)) return SQLITE_OK;
  isFinishing_ = false;
  writtenAt_ = now;
  written_ = grown();
  for (const Loss& loss : written_) {
    const SqliteCode code = writeRow(loss, now);
    if (code != SQLITE_OK) return code;
  }
  return spans().flush();
}

SqliteCode LossRecords::writeRow(const Loss& loss, double now) {
  insert_.bind(1, spans().next());
  insert_.bind(2, now);
  insert_.bind(3, std::string_view(loss.name.first));
  insert_.bind(4, std::string_view(loss.name.second));
  insert_.bind(5, static_cast<std::int64_t>(loss.count));
  SqliteCode code = insert_.run();
  if (code == SQLITE_OK) code = spans().note(now);
  spans().advance();
  return code;
}

void LossRecords::onCommitted(FinishedRecords& /*finished*/) {
  spans().onCommitted();
  for (const Loss& loss : written_) recorded_[loss.name] = loss.total;
  written_.clear();
  if (writtenAt_) lastTime_ = *std::exchange(writtenAt_, std::nullopt);
}

std::uint64_t LossRecords::dropTaken(DropReason /*reason*/, FinishedRecords& /*finished*/) {
  spans().onRolledBack();
  written_.clear();
  writtenAt_ = std::nullopt;
  isFinishing_ = false;
  return 0;
}

}  // namespace halvox::platform::linux_
