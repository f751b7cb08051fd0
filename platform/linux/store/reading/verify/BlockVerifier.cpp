#include "platform/linux/store/reading/verify/BlockVerifier.h"

#include <algorithm>
#include <utility>

#include "platform/linux/store/MessageBlocks.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/reading/verify/JsonCheck.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kBlocks = "message_blocks";
constexpr const char* kSpans = "message_spans";

constexpr auto kMostOpen = static_cast<std::int64_t>(MessageBlocks::kRecordsToSeal);

}  // namespace

SqliteCode BlockVerifier::begin() {
  SqliteCode code = database_.prepare(
      "SELECT id, records, first_time, last_time, block FROM message_blocks ORDER BY id", blocks_);
  if (code == SQLITE_OK) {
    code = database_.prepare(
        "SELECT span, first_time, last_time, keys FROM message_spans ORDER BY span", spans_);
  }
  Statement newest;
  if (code == SQLITE_OK) {
    code = database_.prepare("SELECT ifnull(max(span), -1) FROM message_spans", newest);
  }
  if (code != SQLITE_OK) return code;
  code = newest.step();
  if (code != SQLITE_ROW) return code;
  newestSpan_ = newest.integer(0);
  return stepSpans();
}

SqliteCode BlockVerifier::run() {
  SqliteCode code = begin();
  while (code == SQLITE_OK && (code = blocks_.step()) == SQLITE_ROW) {
    code = skipSpansBefore(blocks_.integer(0));
    if (code == SQLITE_OK) verifyRow();
  }
  if (code == SQLITE_DONE) code = skipSpansBefore(std::nullopt);
  if (!meansDamage(code)) return code;
  differences_.add(kBlocks, "after the number " + std::to_string(next_ - 1),
                   "cannot be read: " + database_.errorText());
  return SQLITE_OK;
}

SqliteCode BlockVerifier::stepSpans() {
  const SqliteCode code = spans_.step();
  hasSpan_ = code == SQLITE_ROW;
  return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

// Moves to the span with that number, or the next one, or with std::nullopt to the end. The spans
// before it have no block.
SqliteCode BlockVerifier::skipSpansBefore(std::optional<std::int64_t> id) {
  SqliteCode code = SQLITE_OK;
  while (code == SQLITE_OK && hasSpan_ && (!id.has_value() || spans_.integer(0) < *id)) {
    differences_.add(kSpans, rowPlace(spans_.integer(0)),
                     "has no row in message_blocks: a block was deleted");
    code = stepSpans();
  }
  return code;
}

void BlockVerifier::verifyRow() {
  const std::int64_t id = blocks_.integer(0);
  const std::int64_t records = blocks_.integer(1);
  if (records < 0)
    return differences_.add(kBlocks, rowPlace(id), "has a negative number of records");
  if (id < next_) {
    differences_.add(
        kBlocks, rowPlace(id),
        "uses numbers that the row before uses too, up to " + std::to_string(next_ - 1));
  }
  next_ = std::max(next_, id + records);
  numbers_ += static_cast<std::uint64_t>(records);
  // A row without records keeps the next number when all others are deleted.
  if (records == 0) return;
  Found found = unpack(id, records);
  if (reader_.isDamaged()) return;
  // A block of erased records keeps their numbers. It has no record whose times and keys could
  // differ.
  if (!found.hasTimes) {
    found.firstTime = blocks_.real(2);
    found.lastTime = blocks_.real(3);
  }
  if (found.firstTime != blocks_.real(2) || found.lastTime != blocks_.real(3)) {
    differences_.add(kBlocks, rowPlace(id), "has other times than its records");
  }
  verifySpan(id, found);
}

BlockVerifier::Found BlockVerifier::unpack(std::int64_t id, std::int64_t records) {
  Found found;
  reader_.open(blocks_.bytes(4), records);
  while (reader_.next()) {
    const BlockRecord& record = reader_.record();
    if (record.kind == BlockRecordKind::kGap) continue;
    note(record, found);
    ++records_;
    if (!isJsonObject(record.payload)) {
      differences_.add(kBlocks, rowPlace(id) + ", record " + std::to_string(reader_.index()),
                       "has a payload that is not a JSON object");
    }
  }
  if (reader_.isDamaged()) {
    differences_.add(kBlocks, rowPlace(id) + ", record " + std::to_string(reader_.index() + 1),
                     "the block is damaged and cannot be unpacked");
  }
  return found;
}

void BlockVerifier::note(const BlockRecord& record, Found& found) {
  const bool isFirst = !std::exchange(found.hasTimes, true);
  found.firstTime = isFirst ? record.time : std::min(found.firstTime, record.time);
  found.lastTime = isFirst ? record.time : std::max(found.lastTime, record.time);
  if (record.kind == BlockRecordKind::kEvent) {
    found.keys.add(blockKey(BlockKeyKind::kName, record.name));
    if (!record.application.empty()) {
      found.keys.add(blockKey(BlockKeyKind::kApplication, record.application));
    }
    return;
  }
  found.keys.add(sessionKey(record.sessionID));
  found.keys.add(blockKey(BlockKeyKind::kApplication, record.clientName));
  found.keys.add(blockKey(BlockKeyKind::kName, record.serviceName));
}

void BlockVerifier::verifySpan(std::int64_t id, Found& found) {
  if (!hasSpan_ || spans_.integer(0) != id) return addOpen(id, blocks_.integer(1));
  if (spans_.real(1) != found.firstTime || spans_.real(2) != found.lastTime) {
    differences_.add(kSpans, rowPlace(id), "has other times than the records of its block");
  }
  if (spans_.bytes(3) != found.keys.bytes()) {
    differences_.add(kSpans, rowPlace(id), "has other keys than the records of its block");
  }
  // The next row compares its number with that of the next span.
  if (stepSpans() != SQLITE_OK) {
    differences_.add(kSpans, "after " + rowPlace(id), "cannot be read: " + database_.errorText());
  }
}

// A row without a span is an open one, or its span was deleted.
void BlockVerifier::addOpen(std::int64_t id, std::int64_t records) {
  if (id < newestSpan_) {
    return differences_.add(kBlocks, rowPlace(id), "has no row in message_spans");
  }
  open_ += records;
  if (open_ >= kMostOpen) {
    differences_.add(kBlocks, rowPlace(id),
                     "has no row in message_spans, and is too long for a row that needs none");
  }
}

}  // namespace halvox::platform::linux_
