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
#include "platform/linux/configuration/Defaults.h"
#include "platform/linux/dispatch/Backpressure.h"
#include "platform/linux/store/EventNames.h"
#include "platform/linux/store/LossRecords.h"
#include "platform/linux/store/MessageRecords.h"
#include "platform/linux/store/OldRecords.h"
#include "platform/linux/store/Retention.h"
#include "platform/linux/store/ServiceRuns.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreCheck.h"
#include "platform/linux/store/StoreErase.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreExtent.h"
#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/StoreRecords.h"
#include "platform/linux/store/StoreVacuum.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/linux/store/spool/SpooledMessages.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

struct StoreOptions {
  std::filesystem::path directory;
  std::filesystem::path root{};  // where summary files are, which an erasure deletes
  std::uint32_t retentionDays = defaults::kRetentionDays;
  std::uint32_t maxMegabytes = defaults::kStorageMegabytes;        // database and log together
  std::vector<std::string> wantedEvents{defaults::kWantedEvents};  // patterns for fnmatch(3)
  QueueLimits queue{};
  std::string bootID = currentBootID();
};

// The SQLite database halvox.db and the one thread that writes to it.
//
//   made --open()--> running --close()--> closed
//
// Any thread may add records to the kinds below. Only one thread writes, because SQLite allows one
// writer at a time, and because a batch of records shares the fixed cost of a commit. The writer
// commits everything that has arrived since its last commit, and starts at once if it was idle. A
// record is in the database within half a second after the call that added it, unless the store
// dropped it. Killing the process after that cannot lose the record. A power cut can lose what the
// last checkpoint of the log had not synced.
//
// Failures never reach the callers. When the disk is full, the file is locked, or reading or
// writing fails, the store drops and counts the records being written, logs at most one error a
// second, and tries again with the next records. If the file was deleted, the store creates a new
// one. If the database is damaged, the store renames it, starts a new one, and copies the records
// of this run into that. StoreCheck checks a database that the last run did not close, in the
// background.
//
// The first transaction of a run notes in the database that the run has begun, the last one that it
// has ended. If the run before did not end in this way, the event `com.tarno.reporting.lastrun`
// says what may be missing.
//
// Owned by the platform. open() and close() belong to one thread.
class SqliteStore {
 public:
  // The services belong to the platform and must outlive the store.
  struct Environment {
    ClockService& clock;
    StatisticsService& statistics;
    Backpressure& backpressure;
  };

  SqliteStore(const StoreOptions& options, const Environment& environment);
  SqliteStore(const SqliteStore&) = delete;
  SqliteStore& operator=(const SqliteStore&) = delete;
  ~SqliteStore() { close(); }

  // Opens the database and starts the writer, or returns why it could not. Call it once. Blocks on
  // the disk.
  Result<void, StoreError> open();
  // Writes the waiting records, copies the write-ahead log into the database and ends the writer.
  // Later records are dropped and counted. Blocks until the writer has ended. Idempotent.
  void close();

  [[nodiscard]] EventNames& eventNames() { return eventNames_; }
  [[nodiscard]] MessageRecords& messages() { return messages_; }
  [[nodiscard]] IssueMetricRecords& issueMetrics() { return issueMetrics_; }
  [[nodiscard]] PowerEventRecords& powerEvents() { return powerEvents_; }
  [[nodiscard]] LinkMessageRecords& linkMessages() { return linkMessages_; }
  [[nodiscard]] SnapshotRecords& snapshots() { return snapshots_; }
  [[nodiscard]] SpooledMessages& spooledMessages() { return spooledMessages_; }
  [[nodiscard]] const ClockService& clock() const { return clock_; }
  // The path of the database. Never changes.
  [[nodiscard]] const std::filesystem::path& databaseFile() const { return files_.database(); }
  // Returns the number of records that wait to be stored. Any thread may call.
  [[nodiscard]] std::uint64_t waiting() { return queue_.waiting(); }
  // Returns true while many records wait. A caller that adds a record may then have to wait. Any
  // thread may call.
  [[nodiscard]] bool isBehind() const { return queue_.isBehind(); }

  // Begins to delete on demand, between the transactions that store records. Returns false if a
  // vacuum runs already, or if the store is closed. Any thread may call; does not block.
  bool beginVacuum(const VacuumRequest& request);
  // How the vacuum is getting on, or how the last one ended. Any thread may call.
  [[nodiscard]] VacuumState vacuumState() { return vacuum_.state(); }
  // The same for an erasure. While an erasure waits for a reader that holds the log, each call of
  // eraseState() makes it try again.
  bool beginErase(const EraseRequest& request);
  [[nodiscard]] EraseState eraseState();

 private:
  using Time = WriterQueue::Time;

  void run();
  void writeTaken();
  void writeEnd();
  void reportLastRun();
  [[nodiscard]] bool hasTaken() const;
  [[nodiscard]] bool makeReady();
  [[nodiscard]] bool logHasRoom();
  [[nodiscard]] SqliteCode writeTransaction();
  Result<void, StoreError> openDatabase();
  [[nodiscard]] SqliteCode useDatabase();
  [[nodiscard]] Failure<StoreError> cannotRead();
  Result<std::string, StoreError> beginAnew(const std::string& finding);
  [[nodiscard]] SqliteCode prepareStatements();
  void replaceDamaged(const std::string& finding);
  void releaseStatements();
  void fail(SqliteCode code, std::string_view what);
  void drop(DropReason reason, std::string_view what);
  void onStored();
  void maintainWhileIdle();
  void vacuumOnce();
  void eraseOnce();
  void releaseMemoryIfIdle();
  [[nodiscard]] bool maintainOnce();
  void closeDatabase();
  void abandonDatabase();

  const StoreSizes sizes_;
  const ClockService& clock_;
  StoreFiles files_;
  WriterQueue queue_;
  EventNames eventNames_;
  MessageRecords messages_;
  LinkMessageRecords linkMessages_;
  IssueMetricRecords issueMetrics_;
  PowerEventRecords powerEvents_;
  SnapshotRecords snapshots_;
  SpooledMessages spooledMessages_;
  LossRecords losses_;
  OldRecords oldEvents_{"analytics_records", "analytics_spans"};
  OldRecords oldLinkMessages_{kLinkMessages.records, kLinkMessages.spans};
  const std::array<RecordKind*, 8> kinds_{&messages_,        &issueMetrics_,   &powerEvents_,
                                          &snapshots_,       &losses_,         &oldEvents_,
                                          &oldLinkMessages_, &spooledMessages_};

  // After open() only the writer's thread uses these.
  Database database_;
  std::optional<FileIdentity> identity_;  // of the open file
  Statement begin_;
  Statement commit_;
  Retention retention_;
  ServiceRuns runs_;
  StoreVacuum vacuum_;
  StoreErase erase_;
  Time nextRound_{};
  std::uint64_t droppedSinceStored_ = 0;
  std::uint64_t bytesSinceRelease_ = 0;  // of payloads, since memory was last released
  OncePerSecond failureLines_;

  StoreExtent extent_;  // the newest records at the time when the database was opened
  StoreCheck check_;    // wakes the writer through queue_, which is declared above and outlives it
  std::thread writer_;
};

}  // namespace halvox::platform::linux_
