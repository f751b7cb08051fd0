#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/clock.h"
#include "platform/linux/runtime/Backpressure.h"
#include "platform/linux/store/AnalyticsRecords.h"
#include "platform/linux/store/EventNames.h"
#include "platform/linux/store/Retention.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/StoreRecords.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

struct StoreOptions {
  std::filesystem::path directory;
  std::uint32_t retentionDays = 30;
  std::uint32_t maxMegabytes = 512;            // database and write-ahead log together
  std::vector<std::string> wantedEvents{"*"};  // glob patterns of event names
  QueueLimits queue{};
};

// The SQLite database halvox.db and the one thread that writes it.
//
//   made --open()--> running --close()--> closed
//
// Callers queue records of each kind; the writer commits all that has come since its last commit,
// at once when it was idle. A record whose caller was let go on is in the database within half a
// second, whatever kills the process then.
//
// While running it absorbs failures: when the disk is full, the file locked or its reading or
// writing fails, the records at hand are dropped and counted, one error line a second tells of it,
// and the next records are tried again. A file that turns out damaged is set aside; one that was
// deleted is replaced by a new one.
class SqliteStore {
 public:
  // The services are not owned and must outlive the store.
  struct Environment {
    ClockService& clock;
    StatisticsService& statistics;
    Backpressure& backpressure;
  };

  SqliteStore(const StoreOptions& options, const Environment& environment);
  SqliteStore(const SqliteStore&) = delete;
  SqliteStore& operator=(const SqliteStore&) = delete;
  ~SqliteStore() { close(); }

  // Opens the database, or says why it cannot, and starts the writer. Once; blocks on the disk.
  [[nodiscard]] std::optional<StoreError> open();
  // Writes what waits, copies the write-ahead log into the database and ends the writer. Records
  // that come later are dropped. Any number of times; blocks until the writer is done.
  void close();

  [[nodiscard]] EventNames& eventNames() { return eventNames_; }
  [[nodiscard]] AnalyticsRecords& analyticsRecords() { return analyticsRecords_; }
  [[nodiscard]] IssueMetricRecords& issueMetrics() { return issueMetrics_; }
  [[nodiscard]] PowerEventRecords& powerEvents() { return powerEvents_; }
  [[nodiscard]] LinkMessageRecords& linkMessages() { return linkMessages_; }
  [[nodiscard]] SnapshotRecords& snapshots() { return snapshots_; }
  [[nodiscard]] const ClockService& clock() const { return clock_; }
  // Records that wait to be stored. Any thread.
  [[nodiscard]] std::uint64_t waiting() { return queue_.waiting(); }

 private:
  using Time = WriterQueue::Time;

  void run();
  void writeTaken();
  [[nodiscard]] bool hasTaken() const;
  [[nodiscard]] bool makeReady();
  [[nodiscard]] bool logHasRoom();
  [[nodiscard]] SqliteCode writeTransaction();
  [[nodiscard]] std::optional<StoreError> openDatabase();
  [[nodiscard]] SqliteCode prepareStatements();
  void releaseStatements();
  void fail(SqliteCode code, std::string_view what);
  void drop(DropReason reason, std::string_view what);
  void onStored();
  void maintainWhileIdle();
  [[nodiscard]] bool maintainOnce();
  void closeDatabase();
  void abandonDatabase();

  const StoreSizes sizes_;
  const ClockService& clock_;
  StoreFiles files_;
  WriterQueue queue_;
  EventNames eventNames_;
  AnalyticsRecords analyticsRecords_;
  IssueMetricRecords issueMetrics_;
  PowerEventRecords powerEvents_;
  LinkMessageRecords linkMessages_;
  SnapshotRecords snapshots_;
  const std::array<RecordKind*, 5> kinds_{&analyticsRecords_, &issueMetrics_, &powerEvents_,
                                          &linkMessages_, &snapshots_};

  // The writer's, after open().
  Database database_;
  std::optional<FileIdentity> identity_;  // of the file that is open
  Statement begin_;
  Statement commit_;
  Retention retention_;
  Time nextRound_{};
  std::uint64_t droppedSinceStored_ = 0;
  OncePerSecond failureLines_;

  std::thread writer_;
};

}  // namespace halvox::platform::linux_
