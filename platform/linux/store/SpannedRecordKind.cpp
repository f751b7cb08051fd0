#include "platform/linux/store/SpannedRecordKind.h"

namespace halvox::platform::linux_ {

SqliteCode SpannedRecordKind::write(TransactionAllowance& allowance) {
  while (hasTaken() && !allowance.isUsedUp()) {
    const SqliteCode code = writeNext(allowance);
    if (code != SQLITE_OK) return code;
  }
  return spans().flush();
}

bool SpannedRecordKind::charge(TransactionAllowance& allowance, std::uint64_t records,
                               std::size_t payloadBytes) {
  written_ += records;
  writtenBytes_ += payloadBytes;
  allowance.records -= static_cast<std::int64_t>(records);
  allowance.payloadBytes -= static_cast<std::int64_t>(payloadBytes);
  if (payloadBytes <= longestPayload_) return true;
  // Count the records as written although they are not stored, because the queue must learn that
  // they no longer wait.
  tooLarge_ += records;
  return false;
}

void SpannedRecordKind::onCommitted(FinishedRecords& finished) {
  spans().onCommitted();
  counters_.addStored(written_ - tooLarge_);
  endTransaction(finished);
}

void SpannedRecordKind::endTransaction(FinishedRecords& finished) {
  // Free the last record and the memory of its text, because the next record may come only after
  // hours.
  encoder_.giveBack();
  if (!hasTaken()) static_cast<void>(forgetTaken());
  if (tooLarge_ > 0) {
    counters_.addDropped(DropReason::kTooLarge, tooLarge_);
    if (tooLargeLines_.tryPass()) logTooLarge(longestPayload_);
  }
  finished.written += written_;
  finished.writtenBytes += writtenBytes_;
  written_ = writtenBytes_ = tooLarge_ = 0;
}

std::uint64_t SpannedRecordKind::dropTaken(DropReason reason, FinishedRecords& finished) {
  spans().onRolledBack();
  const std::uint64_t unwritten = forgetTaken();
  const std::uint64_t dropped = written_ - tooLarge_ + unwritten;
  counters_.addDropped(reason, dropped);
  endTransaction(finished);
  finished.unwritten += unwritten;
  return dropped;
}

}  // namespace halvox::platform::linux_
