#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/clock.h"
#include "platform/linux/store/KindWithSpans.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Stores what the service's counters say was dropped, suppressed, refused or lost, so that a reader
// of the store knows what it does not have. A record says how much a counter has grown since the
// last record of that counter.
//
// Nobody adds these records. The store's transactions take them along, at most once a minute: while
// nothing is stored, the service does not wake for them. finish() asks for a last one. Counts of a
// transaction that fails come with the next one, and counts after the last transaction are lost.
//
// Threads, owner and failures are those of RecordKind.
class LossRecords final : public KindWithSpans {
 public:
  // How long counts are gathered.
  static constexpr double kSecondsBetween = 60;

  // Does not own its arguments, which must outlive it.
  LossRecords(StatisticsService& statistics, const ClockService& clock);

  // Makes hasTaken() true if a counter has grown. Call before the last transaction.
  void finish();

  [[nodiscard]] SqliteCode prepare(Database& database) override;
  void release() override;
  void takeQueued() override {}
  [[nodiscard]] bool hasTaken() const override { return isFinishing_; }
  [[nodiscard]] SqliteCode write(TransactionAllowance& allowance) override;
  void onCommitted(FinishedRecords& finished) override;
  std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) override;

 private:
  using Name = std::pair<std::string, std::string>;  // piece and name of a counter
  struct Loss {
    Name name{};
    std::uint64_t count = 0;  // since the last record
    std::uint64_t total = 0;
  };

  [[nodiscard]] bool isDue(double now) const;
  [[nodiscard]] std::vector<Loss> grown() const;
  [[nodiscard]] SqliteCode writeRow(const Loss& loss, double now);

  StatisticsService& statistics_;
  const ClockService& clock_;
  Statement insert_;
  std::map<Name, std::uint64_t> recorded_;  // the totals that the store has
  std::vector<Loss> written_;               // in the open transaction
  std::optional<double> writtenAt_;         // if the open transaction has looked at the counters
  double lastTime_;                         // of the last transaction that did, or of the start
  bool isFinishing_ = false;
};

}  // namespace halvox::platform::linux_
