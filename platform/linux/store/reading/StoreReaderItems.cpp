#include <algorithm>
#include <memory>
#include <utility>
#include <vector>

#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/BlockScan.h"
#include "platform/linux/store/reading/EventScan.h"
#include "platform/linux/store/reading/RecordScan.h"
#include "platform/linux/store/reading/StoreReader.h"

// How records of several kinds are read in one pass.
namespace halvox::platform::linux_ {
namespace {

// One ordered sequence of records. Call begin(), then advance() until isAtEnd(). After an error the
// cursor must not be used again.
class ItemCursor {
 public:
  ItemCursor() = default;
  ItemCursor(const ItemCursor&) = delete;
  ItemCursor& operator=(const ItemCursor&) = delete;
  virtual ~ItemCursor() = default;

  [[nodiscard]] virtual SqliteCode begin() = 0;
  // Moves to the next record. The views of the previous record are no longer valid then.
  [[nodiscard]] virtual SqliteCode advance() = 0;
  [[nodiscard]] const StoredItem& item() const { return item_; }
  [[nodiscard]] bool isAtEnd() const { return isAtEnd_; }

 protected:
  StoredItem item_{};
  bool isAtEnd_ = false;
};

// The events and the link messages in blocks.
class BlockCursor final : public ItemCursor {
 public:
  BlockCursor(Database& database, const RecordFilter& filter)
      : scan_(database, std::nullopt, filter) {}

  SqliteCode begin() override { return scan_.begin(); }
  SqliteCode advance() override {
    while (!found_ || !scan_.nextRecord()) {
      if (scan_.isDamaged()) return SQLITE_CORRUPT;
      const SqliteCode code = scan_.nextBlock(found_);
      if (code != SQLITE_OK) return code;
      if (!found_) {
        isAtEnd_ = true;
        return SQLITE_OK;
      }
    }
    const BlockRecord& record = scan_.record();
    const bool isLink = record.kind == BlockRecordKind::kLink;
    item_ = {.table = isLink ? &kLinkMessages : nullptr,
             .id = scan_.id(),
             .time = record.time,
             .name = record.name,
             .application = record.application,
             .sessionID = record.sessionID,
             .clientName = record.clientName,
             .serviceName = record.serviceName,
             .number = record.category,
             .type = record.type,
             .payload = record.payload,
             .path = {}};
    return SQLITE_OK;
  }

  // Returns the number of the last record of the pass. Known after begin().
  [[nodiscard]] StoredRecordID last() const { return scan_.last(); }

 private:
  BlockScan scan_;
  bool found_ = false;
};

// Records that are not in blocks. Their scan reads them in pieces.
template <typename Scan, typename Piece>
class PieceCursor : public ItemCursor {
 public:
  explicit PieceCursor(Scan scan) : scan_(std::move(scan)) {}

  SqliteCode begin() final { return scan_.begin(); }
  SqliteCode advance() final {
    while (next_ == size()) {
      if (scan_.isAtEnd()) {
        isAtEnd_ = true;
        return SQLITE_OK;
      }
      const SqliteCode code = scan_.next(piece_);
      if (code != SQLITE_OK) return code;
      next_ = 0;
    }
    show(next_++);
    return SQLITE_OK;
  }

 protected:
  // The number of records in the piece, and what makes one of them the item.
  [[nodiscard]] virtual std::size_t size() const = 0;
  virtual void show(std::size_t index) = 0;

  Scan scan_;
  Piece piece_;

 private:
  std::size_t next_ = 0;
};

// Events of earlier versions, which are not in blocks.
class EventCursor final : public PieceCursor<EventScan, EventScan::Piece> {
 public:
  EventCursor(Database& database, const RecordFilter& filter)
      : PieceCursor(EventScan(database, filter)) {}

 private:
  [[nodiscard]] std::size_t size() const override { return piece_.events.size(); }
  void show(std::size_t index) override {
    const EventScan::Event& event = piece_.events[index];
    item_ = {};
    item_.id = event.id;
    item_.time = event.time;
    item_.name = scan_.nameOf(event.nameID);
    item_.payload = piece_.payloads[event.payload];
  }
};

// The records of one kind of which each has a row of its own.
class RowCursor final : public PieceCursor<RecordScan, std::vector<StoredRecord>> {
 public:
  RowCursor(Database& database, const RecordTable& table, const RecordFilter& filter)
      : PieceCursor(RecordScan(database, table, filter)), table_(table) {}

 private:
  [[nodiscard]] std::size_t size() const override { return piece_.size(); }
  void show(std::size_t index) override {
    const StoredRecord& record = piece_[index];
    item_ = {};
    item_.table = &table_;
    item_.id = record.id;
    item_.time = record.time;
    if (&table_ == &kLinkMessages) {
      item_.sessionID = record.number(kLinkSessionID);
      item_.clientName = record.text(kLinkClientName);
      item_.serviceName = record.text(kLinkServiceName);
      item_.number = record.number(kLinkCategory);
      item_.type = record.number(kLinkType);
      item_.payload = record.text(kLinkPayload);
    } else if (&table_ == &kPowerEvents) {
      item_.number = record.number(kPowerCategory);
      item_.name = record.text(kPowerEventName);
      item_.payload = record.text(kPowerPayload);
    } else if (&table_ == &kIssueMetrics) {
      item_.number = record.number(kMetricID);
      item_.payload = record.text(kMetricMessage);
    } else if (&table_ == &kLosses) {
      item_.name = record.text(kLossPiece);
      item_.payload = record.text(kLossReason);
      item_.number = record.number(kLossCount);
    } else {
      item_.payload = record.text(kSnapshotSignature);
      item_.path = record.text(kSnapshotPath);
    }
  }

  const RecordTable& table_;
};

using Cursors = std::vector<std::unique_ptr<ItemCursor>>;

// Returns the cursors of everything but the messages in blocks.
Cursors rowCursors(Database& database, std::int64_t version, const StoredKinds& kinds,
                   const RecordFilter& filter) {
  Cursors cursors;
  // If an older service made the store, it may lack the table and has no such records then.
  const auto addRows = [&](bool wanted, const RecordTable& table) {
    if (!wanted || version < table.sinceVersion) return;
    cursors.push_back(std::make_unique<RowCursor>(database, table, filter));
  };
  if (kinds.messages) cursors.push_back(std::make_unique<EventCursor>(database, filter));
  addRows(kinds.messages, kLinkMessages);
  addRows(kinds.metrics, kIssueMetrics);
  addRows(kinds.power, kPowerEvents);
  addRows(kinds.snapshots, kSnapshots);
  addRows(kinds.losses, kLosses);
  return cursors;
}

// Returns the cursor with the oldest record; nullptr if all are at their end. A heap would cost
// more than it saves, because there are at most seven cursors.
ItemCursor* oldestOf(const Cursors& cursors) {
  ItemCursor* oldest = nullptr;
  for (const auto& cursor : cursors) {
    if (cursor->isAtEnd()) continue;
    if (oldest == nullptr || cursor->item().time < oldest->item().time) oldest = cursor.get();
  }
  return oldest;
}

}  // namespace

Result<void, StoreError> StoreReader::forEachItem(const StoredKinds& kinds,
                                                  const RecordFilter& filter,
                                                  const ItemCallback& callback) {
  if (!database_.isOpen()) return Failure<StoreError>{StoreError::kMissing, "no store is open"};
  // Read the version at each call. A service may have migrated the store since it was opened.
  const auto version = database_.queryInteger("PRAGMA user_version");
  if (!version.has_value()) return failure(sqlite3_extended_errcode(database_.get()));
  RecordFilter times;
  times.since = filter.since;
  times.until = filter.until;
  // New messages go into blocks, whose numbers continue after those of the old tables.
  StoredKinds kindsInRows = kinds;
  kindsInRows.messages = kinds.messages && filter.after == 0;
  Cursors cursors = rowCursors(database_, *version, kindsInRows, times);
  RecordFilter newer = times;
  newer.after = filter.after;
  const BlockCursor* blocks = nullptr;
  if (kinds.messages && *version >= kBlocksSinceVersion) {
    auto cursor = std::make_unique<BlockCursor>(database_, newer);
    blocks = cursor.get();
    cursors.push_back(std::move(cursor));
  }
  const auto failed = [&](const ItemCursor& cursor, SqliteCode code) {
    // SQLite does not notice damage inside a block and has no text for it.
    return code == SQLITE_CORRUPT && sqlite3_errcode(database_.get()) != SQLITE_CORRUPT
               ? damagedBlock(cursor.item().id)
               : failure(code);
  };
  for (const auto& cursor : cursors) {
    SqliteCode code = cursor->begin();
    if (code == SQLITE_OK) code = cursor->advance();
    if (code != SQLITE_OK) return failed(*cursor, code);
  }
  isStopped_ = false;
  while (ItemCursor* const cursor = oldestOf(cursors)) {
    callback(cursor->item());
    if (isStopped_) return {};
    const SqliteCode code = cursor->advance();
    if (code != SQLITE_OK) return failed(*cursor, code);
  }
  if (kinds.messages) lastRead_ = blocks == nullptr ? 0 : std::max(filter.after, blocks->last());
  return {};
}

}  // namespace halvox::platform::linux_
