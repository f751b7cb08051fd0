#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/blocks/MessageBlock.h"

namespace halvox::platform::linux_ {

class BlockScan;

// The position of a record among the records of its kind, in the order of storing. IDs only grow
// and may have gaps. They start again from 1 when a new database replaces the old one.
using StoredRecordID = std::int64_t;

// Selects the records that have one of these numbers in a column.
struct NumberMatch {
  std::size_t column;  // index into RecordTable::columns
  std::vector<std::int64_t> numbers;
};

// A stored event. Its views are valid during the callback only.
struct StoredEvent {
  StoredRecordID id;
  double time;  // seconds since 1970
  std::string_view name;
  std::string_view payload;  // JSON text
  // Stored beside the payload; empty for events of earlier versions.
  std::string_view application{};
};

// A stored record of any other kind. `fields` has the values of RecordTable::columns, in their
// order. A column of bytes is a std::string.
struct StoredRecord {
  using Field = std::variant<std::int64_t, std::string>;
  StoredRecordID id;
  double time;  // seconds since 1970
  std::vector<Field> fields;

  [[nodiscard]] std::int64_t number(std::size_t column) const {
    return std::get<std::int64_t>(fields[column]);
  }
  [[nodiscard]] const std::string& text(std::size_t column) const {
    return std::get<std::string>(fields[column]);
  }
};

// A stored record of any kind, without a copy of its texts. Its views are valid during the callback
// only. A member that the kind does not have is empty or 0.
struct StoredItem {
  const RecordTable* table = nullptr;  // null: an event
  StoredRecordID id = 0;
  double time = 0;               // seconds since 1970
  std::string_view name;         // of an event or a power event; the piece that counted a loss
  std::string_view application;  // of an event in a block; empty if the payload does not name it
  std::int64_t sessionID = 0;    // of a link message, with the next two
  std::string_view clientName;
  std::string_view serviceName;
  std::int64_t number = 0;   // a link message's or a power event's category, a metric's ID, a
                             // loss's count
  std::int64_t type = 0;     // of a link message
  std::string_view payload;  // JSON text; a metric's bytes; a snapshot's signature; a loss's reason
  std::string_view path;     // of a snapshot
};

// Which kinds forEachItem() reads. Events and link messages are read together.
struct StoredKinds {
  bool messages = true;
  bool metrics = false;
  bool power = false;
  bool snapshots = false;
  bool losses = false;
};

enum class RecordOrder : std::uint8_t { kOldestFirst, kNewestFirst };

// Which records to read, and in which order. A member that is not set selects everything.
struct RecordFilter {
  // Patterns for fnmatch(3). The name must match at least one of them. Kinds without a name ignore
  // them.
  std::vector<std::string> names{};
  std::optional<double> since{};           // seconds since 1970, inclusive
  std::optional<double> until{};           // seconds since 1970, exclusive
  StoredRecordID after = 0;                // only records stored after this one
  std::optional<StoredRecordID> before{};  // only records stored before this one
  std::optional<std::uint64_t> newest{};   // at most this many, the newest
  std::vector<NumberMatch> numbers{};      // all must match; events ignore them
  // A further condition, called only for records that meet all others. Events ignore it.
  std::function<bool(const StoredRecord&)> accepts{};
  // The same for events; the other kinds ignore it.
  std::function<bool(const StoredEvent&)> acceptsEvent{};
  RecordOrder order = RecordOrder::kOldestFirst;
  // Asked after each record that was delivered. The pass ends when it returns true, and must then
  // return true again.
  std::function<bool()> isEnough{};
};

// Reads a store without changing it, whether or not a service writes to it at the same time.
// Belongs to one thread and one owner. Returns errors. After any error the reader can be opened
// again.
//
// Reads in pieces and holds no lock and no snapshot while a callback runs. A snapshot would keep
// the service from reusing its write-ahead log, and a slow reader would make the log grow.
class StoreReader {
 public:
  using EventCallback = std::function<void(const StoredEvent&)>;
  using RecordCallback = std::function<void(const StoredRecord&)>;
  using ItemCallback = std::function<void(const StoredItem&)>;

  // Opens the store in `directory`, and closes the store that was open before. Fails with kMissing
  // if there is no store or nothing was stored yet, or with kDamaged, kNewerVersion or kCannotOpen.
  Result<void, StoreError> open(const std::filesystem::path& directory);

  // Calls `callback` on this thread for each event that passes the filter, in the order of storing
  // or in the opposite order. Delivers the events that were stored when the call began. Waits up to
  // one second for a locked database. If there is an error, the events before it have been
  // delivered. Memory does not grow with the number of events in either order.
  Result<void, StoreError> forEachEvent(const RecordFilter& filter, const EventCallback& callback);
  // Reads the records of another kind in the same way. If the store has an older version that lacks
  // the kind, there are no such records, which is not an error.
  Result<void, StoreError> forEachRecord(const RecordTable& table, const RecordFilter& filter,
                                         const RecordCallback& callback);

  // Returns true if the store removed events or link messages of the last pass before the pass
  // reached them, after it had begun or after RecordFilter::after. Only for a pass in the order of
  // storing. A callback that waits, such as for a person, may cause it.
  [[nodiscard]] bool hasGap() const { return hasGap_; }

  // Calls `callback` on this thread for each record of several kinds within a range of time. Events
  // and link messages come in the order of storing; the other kinds are merged with them by time.
  // Uses only the times of the filter and, for messages, `after`: a value of lastRead() makes this
  // call read the messages that were stored since. Sets lastRead() if messages are read. Memory
  // does not grow with the store.
  Result<void, StoreError> forEachItem(const StoredKinds& kinds, const RecordFilter& filter,
                                       const ItemCallback& callback);

  // Ends the running forEachItem() after the record whose callback calls this. It then returns
  // success and does not change lastRead(). For a caller that can use no further records: reading a
  // large store takes minutes.
  void stopReading() { isStopped_ = true; }

  // Returns the last record that the last successful call of forEachEvent(), forEachRecord() or,
  // for messages, forEachItem() looked at, whether or not it passed the filter. A call of the same
  // function that continues after that record misses none. Without meaning after a pass
  // that RecordFilter::isEnough ended or that `order` reversed.
  [[nodiscard]] StoredRecordID lastRead() const { return lastRead_; }

  // Returns true if no store is open, or if the path leads to another database or to none now. Then
  // call open() again. Record IDs may start from 1.
  [[nodiscard]] bool isReplaced() const;

  // Returns the connection to the open store, for other queries than reading records.
  [[nodiscard]] Database& database() { return database_; }

 private:
  [[nodiscard]] Failure<StoreError> failure(SqliteCode code) const;
  [[nodiscard]] Failure<StoreError> damagedBlock(StoredRecordID after) const;
  [[nodiscard]] Result<void, StoreError> outcome(SqliteCode code) const;
  Result<void, StoreError> openDatabase();
  // Calls `deliver` for each record in blocks. Before that, or after it in the opposite order,
  // calls `old`, which reads the records that are not in blocks and sets lastRead_.
  template <typename ReadOld, typename Deliver>
  Result<void, StoreError> forEachMessage(BlockRecordKind kind, const RecordFilter& filter,
                                          ReadOld old, Deliver deliver);
  template <typename Deliver>
  [[nodiscard]] SqliteCode readBlocks(BlockScan& blocks, const RecordFilter& filter,
                                      Deliver deliver);
  [[nodiscard]] SqliteCode readOldEvents(const RecordFilter& filter, const EventCallback& callback);
  [[nodiscard]] SqliteCode readRows(const RecordTable& table, const RecordFilter& filter,
                                    const RecordCallback& callback);
  [[nodiscard]] SqliteCode openFile();

  std::optional<StoreFiles> files_;
  Database database_;
  std::optional<FileIdentity> identity_;
  StoredRecordID lastRead_ = 0;
  bool isStopped_ = false;  // the running forEachItem()
  bool hasGap_ = false;
};

}  // namespace halvox::platform::linux_
