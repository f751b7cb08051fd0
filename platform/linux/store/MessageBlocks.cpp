#include "platform/linux/store/MessageBlocks.h"

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/store/EraseSelection.h"
#include "platform/linux/store/RecordKind.h"

namespace halvox::platform::linux_ {
namespace {

// An open row with fewer records is not compressed, because it fits into the page that its commit
// writes in any case.
constexpr std::uint64_t kRecordsToCompress = 24;
// A sealed block has at most this many records. Larger blocks would save few bytes, and a reader
// that wants one record unpacks a whole block, which takes 1 ms at this size.
constexpr std::uint64_t kMostRecords = 1024;
constexpr std::uint64_t kMostBytes = std::uint64_t{256} * 1024;

ErasableRecord erasablePart(const BlockRecord& record) {
  const bool isLink = record.kind == BlockRecordKind::kLink;
  return {.kind = isLink ? ErasableRecord::Kind::kLink : ErasableRecord::Kind::kEvent,
          .application = record.application,
          .sessionID = record.sessionID,
          .payload = record.payload};
}

constexpr const char* kNoSpan = "(SELECT ifnull(max(span), -1) FROM message_spans)";

}  // namespace

SqliteCode MessageBlocks::prepare(Database& database) {
  isStateKnown_ = false;
  const std::string openRows = std::string(" FROM message_blocks WHERE id > ") + kNoSpan;
  for (const auto& [statement, sql] :
       {std::pair<Statement*, std::string>{
            &statements_.insertBlock,
            // REPLACE, because a row without records may exist that stores the next number.
            "INSERT OR REPLACE INTO message_blocks VALUES (?1, ?2, ?3, ?4, ?5)"},
        {&statements_.insertSpan, "INSERT OR REPLACE INTO message_spans VALUES (?1, ?2, ?3, ?4)"},
        {&statements_.newest, "SELECT id, records FROM message_blocks ORDER BY id DESC LIMIT 1"},
        {&statements_.openRows,
         "SELECT id, records, block, last_time" + openRows + " AND records > 0 ORDER BY id"},
        {&statements_.deleteOpenRows, "DELETE FROM message_blocks WHERE id >= ?1"},
        {&statements_.oldest,
         "SELECT id, records, first_time FROM message_blocks WHERE records > 0"
         " ORDER BY id LIMIT 1"},
        {&statements_.agedSpan,
         "SELECT span FROM message_spans WHERE first_time < ?1 ORDER BY span LIMIT 1"},
        {&statements_.agedOpenRow,
         "SELECT id" + openRows + " AND records > 0 AND first_time < ?1 ORDER BY id LIMIT 1"},
        {&statements_.block, "SELECT records, last_time, block FROM message_blocks WHERE id = ?1"},
        {&statements_.deleteBlock, "DELETE FROM message_blocks WHERE id = ?1"},
        {&statements_.deleteSpan, "DELETE FROM message_spans WHERE span = ?1"}}) {
    const SqliteCode code = database.prepare(sql, *statement);
    if (code != SQLITE_OK) return code;
  }
  return SQLITE_OK;
}

void MessageBlocks::release() {
  statements_ = {};
  writer_.release();
  isStateKnown_ = false;
}

SqliteCode MessageBlocks::readState() {
  if (isStateKnown_) return SQLITE_OK;
  next_ = firstOpen_ = 1;
  openBytes_ = 0;
  SqliteCode code = statements_.newest.step();
  if (code == SQLITE_ROW) {
    next_ = firstOpen_ = statements_.newest.integer(0) + statements_.newest.integer(1);
  }
  statements_.newest.reset();
  if (code != SQLITE_ROW && code != SQLITE_DONE) return code;
  bool isFirst = true;
  while ((code = statements_.openRows.step()) == SQLITE_ROW) {
    if (std::exchange(isFirst, false)) firstOpen_ = statements_.openRows.integer(0);
    openBytes_ += statements_.openRows.bytes(2).size();
  }
  statements_.openRows.reset();
  if (code != SQLITE_DONE) return code;
  isStateKnown_ = true;
  clearGathered();
  // Seal open rows of an earlier run now, without records of this run. After damage, the store
  // copies only the blocks of this run into a new database, and a block with records of both runs
  // could not be divided.
  return firstOpen_ < next_ ? sealOpenRows() : SQLITE_OK;
}

SqliteCode MessageBlocks::begin(std::uint64_t records) {
  SqliteCode code = readState();
  if (code != SQLITE_OK) return code;
  clearGathered();
  const auto open = static_cast<std::uint64_t>(next_ - firstOpen_);
  const bool isEnough = open + records >= kRecordsToSeal || openBytes_ >= kMostBytes;
  return open > 0 && isEnough ? gatherOpenRows() : SQLITE_OK;
}

// Moves the records of the open rows into writer_ and deletes the rows. The sealed block gets the
// number of the first row.
SqliteCode MessageBlocks::gatherOpenRows() {
  gathered_.first = firstOpen_;
  SqliteCode code = SQLITE_ROW;
  while ((code = statements_.openRows.step()) == SQLITE_ROW) {
    const SqliteCode added =
        gatherBlock(statements_.openRows.bytes(2), statements_.openRows.integer(1), {});
    gathered_.timeOfGaps = statements_.openRows.real(3);
    if (added != SQLITE_OK) {
      code = added;
      break;
    }
  }
  statements_.openRows.reset();
  if (code != SQLITE_DONE) return code;
  statements_.deleteOpenRows.bind(1, firstOpen_);
  code = statements_.deleteOpenRows.run();
  firstOpen_ = next_;
  openBytes_ = 0;
  return code;
}

SqliteCode MessageBlocks::sealOpenRows() {
  const SqliteCode code = gatherOpenRows();
  return code == SQLITE_OK ? insert(Row::kSealed) : code;
}

// Adds the records of a block to writer_. Those for which `isGone` returns true become gaps.
SqliteCode MessageBlocks::gatherBlock(std::string_view block, std::int64_t records,
                                      const IsGone& isGone) {
  MessageBlockReader reader;  // a member would keep the memory of a long payload
  reader.open(block, records);
  while (reader.next()) {
    const BlockRecord& record = reader.record();
    if (record.kind == BlockRecordKind::kGap || (isGone && isGone(reader.index(), record))) {
      writer_.addGap();
      continue;
    }
    note(record.time);
    if (record.kind == BlockRecordKind::kEvent) {
      writer_.addEvent(record.time, {record.name, record.application}, record.payload);
    } else {
      const LinkParty party{record.sessionID, std::string(record.clientName),
                            std::string(record.serviceName)};
      writer_.addLink(record.time,
                      {party, static_cast<std::uint16_t>(record.category),
                       static_cast<std::uint16_t>(record.type)},
                      record.payload);
    }
  }
  return reader.isDamaged() ? SQLITE_CORRUPT : SQLITE_OK;
}

void MessageBlocks::note(double time) {
  const bool isFirst = !std::exchange(gathered_.hasTimes, true);
  gathered_.firstTime = isFirst ? time : std::min(gathered_.firstTime, time);
  gathered_.lastTime = isFirst ? time : std::max(gathered_.lastTime, time);
}

SqliteCode MessageBlocks::addEvent(double time, const EventHead& head, std::string_view payload) {
  if (writer_.records() == 0) gathered_.first = next_;
  note(time);
  writer_.addEvent(time, head, payload);
  return afterAdding();
}

SqliteCode MessageBlocks::addLink(double time, const LinkHead& head, std::string_view payload) {
  if (writer_.records() == 0) gathered_.first = next_;
  note(time);
  writer_.addLink(time, head, payload);
  return afterAdding();
}

SqliteCode MessageBlocks::afterAdding() {
  ++next_;
  const bool isFull = writer_.records() >= kMostRecords || writer_.bytes() >= kMostBytes;
  if (!isFull) return SQLITE_OK;
  if (firstOpen_ >= gathered_.first) return insert(Row::kSealed);
  // begin() expected a few records and left the open rows as they are, but long records fill a
  // block all the same. Readers look for open rows only after the last sealed one.
  const SqliteCode code = insert(Row::kOpen);
  return code == SQLITE_OK ? sealEachOpenRow() : code;
}

// Makes each open row a sealed one.
SqliteCode MessageBlocks::sealEachOpenRow() {
  struct OpenRow {
    std::int64_t id;
    std::int64_t records;
    std::string block;
    double lastTime;
  };
  std::vector<OpenRow> rows;
  SqliteCode code = SQLITE_ROW;
  while ((code = statements_.openRows.step()) == SQLITE_ROW) {
    rows.push_back({statements_.openRows.integer(0), statements_.openRows.integer(1),
                    std::string(statements_.openRows.bytes(2)), statements_.openRows.real(3)});
  }
  statements_.openRows.reset();
  if (code != SQLITE_DONE) return code;
  statements_.deleteOpenRows.bind(1, firstOpen_);
  code = statements_.deleteOpenRows.run();
  for (const OpenRow& row : rows) {
    if (code != SQLITE_OK) break;
    gathered_.first = row.id;
    gathered_.timeOfGaps = row.lastTime;
    code = gatherBlock(row.block, row.records, {});
    if (code == SQLITE_OK && row.records > 0) code = insert(Row::kSealed);
  }
  openBytes_ = 0;
  return code;
}

SqliteCode MessageBlocks::end() {
  if (writer_.records() == 0) return SQLITE_OK;
  // Open rows that were gathered must not become an open row again, however few their records are:
  // firstOpen_ is already past their numbers.
  const bool hasOpenRows = gathered_.first < firstOpen_;
  const bool isEnough = hasOpenRows || writer_.records() >= kRecordsToSeal;
  return insert(isEnough ? Row::kSealed : Row::kOpen);
}

// Writes the records of writer_ into a row.
SqliteCode MessageBlocks::insert(Row row) {
  if (!gathered_.hasTimes) gathered_.firstTime = gathered_.lastTime = gathered_.timeOfGaps;
  const bool isShort = row == Row::kOpen && writer_.records() < kRecordsToCompress;
  const std::string_view block =
      writer_.finish(isShort ? BlockPacking::kPlain : BlockPacking::kZstd);
  statements_.insertBlock.bind(1, gathered_.first);
  statements_.insertBlock.bind(2, static_cast<std::int64_t>(writer_.records()));
  statements_.insertBlock.bind(3, gathered_.firstTime);
  statements_.insertBlock.bind(4, gathered_.lastTime);
  statements_.insertBlock.bind(5, std::as_bytes(std::span(block)));
  SqliteCode code = statements_.insertBlock.run();
  if (row == Row::kOpen) {
    openBytes_ += block.size();
  } else {
    if (code == SQLITE_OK) code = insertSpan();
    firstOpen_ = next_;
  }
  clearGathered();
  return code;
}

SqliteCode MessageBlocks::insertSpan() {
  statements_.insertSpan.bind(1, gathered_.first);
  statements_.insertSpan.bind(2, gathered_.firstTime);
  statements_.insertSpan.bind(3, gathered_.lastTime);
  const std::string_view keys = writer_.keys();
  statements_.insertSpan.bind(4, std::as_bytes(std::span(keys)));
  return statements_.insertSpan.run();
}

void MessageBlocks::clearGathered() {
  if (writer_.records() > 0) sealedBytes_ += writer_.bytes();
  writer_.clear();
  gathered_ = {};
}

// Frees the memory of a long payload now, because the next record may come only after hours.
void MessageBlocks::onCommitted() {
  clearGathered();
  sealedBytes_ = 0;
}

void MessageBlocks::onRolledBack() {
  isStateKnown_ = false;
  clearGathered();
  sealedBytes_ = 0;
}

SqliteCode MessageBlocks::oldestTime(std::optional<double>& time) {
  time.reset();
  const SqliteCode code = statements_.oldest.step();
  if (code == SQLITE_ROW) time = statements_.oldest.real(2);
  statements_.oldest.reset();
  return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode MessageBlocks::deleteOldest(bool& found) {
  SqliteCode code = readState();
  if (code != SQLITE_OK) return code;
  code = statements_.oldest.step();
  found = code == SQLITE_ROW;
  const std::int64_t id = found ? statements_.oldest.integer(0) : 0;
  const std::int64_t records = found ? statements_.oldest.integer(1) : 0;
  statements_.oldest.reset();
  if (!found) return code == SQLITE_DONE ? SQLITE_OK : code;
  return deleteRow(id, records);
}

SqliteCode MessageBlocks::deleteRow(std::int64_t id, std::int64_t records) {
  statements_.deleteBlock.bind(1, id);
  SqliteCode code = statements_.deleteBlock.run();
  statements_.deleteSpan.bind(1, id);
  if (code == SQLITE_OK) code = statements_.deleteSpan.run();
  if (code != SQLITE_OK) return code;
  if (id >= firstOpen_) firstOpen_ = id + records;
  if (id + records != next_) return SQLITE_OK;
  // The deleted row was the newest one, and the next number follows from the newest row. Add a row
  // without records to keep that number.
  statements_.insertBlock.bind(1, next_);
  statements_.insertBlock.bind(2, std::int64_t{0});
  statements_.insertBlock.bind(3, 0.0);
  statements_.insertBlock.bind(4, 0.0);
  statements_.insertBlock.bind(5, std::span<const std::byte>());
  return statements_.insertBlock.run();
}

SqliteCode MessageBlocks::deleteOlderThan(double time, bool& found) {
  found = false;
  SqliteCode code = readState();
  if (code != SQLITE_OK) return code;
  std::int64_t id = 0;
  for (Statement* const aged : {&statements_.agedSpan, &statements_.agedOpenRow}) {
    aged->bind(1, time);
    code = aged->step();
    found = code == SQLITE_ROW;
    if (found) id = aged->integer(0);
    aged->reset();
    if (code != SQLITE_ROW && code != SQLITE_DONE) return code;
    if (found) return trim(id, time);
  }
  return SQLITE_OK;
}

SqliteCode MessageBlocks::trim(std::int64_t id, double time) {
  statements_.block.bind(1, id);
  SqliteCode code = statements_.block.step();
  if (code != SQLITE_ROW) {
    statements_.block.reset();
    return code == SQLITE_DONE ? SQLITE_CORRUPT : code;
  }
  const StoredBlock row{.id = id,
                        .records = statements_.block.integer(0),
                        .lastTime = statements_.block.real(1),
                        .block = std::string(statements_.block.bytes(2))};
  statements_.block.reset();
  if (row.lastTime < time) return deleteRow(id, row.records);
  return rewrite(row, [time](std::int64_t /*number*/, const BlockRecord& record) {
    return record.time < time;
  });
}

SqliteCode MessageBlocks::rewrite(const StoredBlock& row, const IsGone& isGone) {
  clearGathered();
  gathered_.first = row.id;
  gathered_.timeOfGaps = row.lastTime;
  SqliteCode code = gatherBlock(row.block, row.records, isGone);
  if (code != SQLITE_OK) return code;
  const bool isOpen = row.id >= firstOpen_;
  const std::int64_t firstOpen = firstOpen_;
  if (isOpen) openBytes_ -= std::min<std::uint64_t>(openBytes_, row.block.size());
  code = insert(isOpen ? Row::kOpen : Row::kSealed);
  firstOpen_ = firstOpen;
  sealedBytes_ = 0;
  return code;
}

SqliteCode MessageBlocks::erase(Database& database, ErasePass& pass, bool& more) {
  more = false;
  SqliteCode code = readState();
  if (code != SQLITE_OK) return code;
  if (pass.last < 0) pass.last = next_ - 1;
  Statement next;
  // Open rows may have become one row since the step before. Its ID is lower than `next`.
  code = database.prepare(
      "SELECT id, records, last_time, block FROM message_blocks"
      " WHERE id >= (SELECT ifnull(max(id), 0) FROM message_blocks WHERE id <= ?1)"
      " AND id <= ?2 AND id + records > ?1 ORDER BY id LIMIT 1",
      next);
  if (code != SQLITE_OK) return code;
  next.bind(1, pass.next);
  next.bind(2, pass.last);
  code = next.step();
  more = code == SQLITE_ROW;
  if (!more) return code == SQLITE_DONE ? SQLITE_OK : code;
  const StoredBlock row{.id = next.integer(0),
                        .records = next.integer(1),
                        .lastTime = next.real(2),
                        .block = std::string(next.bytes(3))};
  next.reset();
  pass.next = row.id + row.records;
  return visit(row, pass);
}

SqliteCode MessageBlocks::visit(const StoredBlock& row, ErasePass& pass) {
  if (!pass.isLooking) {
    MessageBlockReader reader;
    reader.open(row.block, row.records);
    while (reader.next()) pass.selection->announce(erasablePart(reader.record()));
  }
  std::vector<bool> gone;
  bool hasOthers = false;
  MessageBlockReader reader;
  reader.open(row.block, row.records);
  std::uint64_t erased = 0;
  while (reader.next()) {
    const BlockRecord& record = reader.record();
    if (record.kind == BlockRecordKind::kGap || row.id + reader.index() > pass.last) {
      hasOthers = hasOthers || record.kind != BlockRecordKind::kGap;
      gone.push_back(false);
      continue;
    }
    const ErasableRecord part = erasablePart(record);
    if (pass.isLooking) pass.selection->look(part);
    gone.push_back(!pass.isLooking && pass.selection->selects(part));
    hasOthers = hasOthers || !gone.back();
    erased += gone.back() ? 1U : 0U;
  }
  if (reader.isDamaged()) return SQLITE_CORRUPT;
  if (erased == 0) return SQLITE_OK;
  pass.erased += erased;
  SqliteCode code = statements_.oldest.step();
  const bool isOldest = code == SQLITE_ROW && statements_.oldest.integer(0) == row.id;
  statements_.oldest.reset();
  if (code != SQLITE_ROW && code != SQLITE_DONE) return code;
  if (isOldest && !hasOthers) return deleteRow(row.id, row.records);
  return rewrite(row, [&gone](std::int64_t number, const BlockRecord& /*record*/) {
    return gone[static_cast<std::size_t>(number)];
  });
}

}  // namespace halvox::platform::linux_
