#include "platform/linux/link/nats/AckLedger.h"

#include <optional>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

struct Flushed {
  AckLedger::Done done() {
    return [this](const AckTally& reported) {
      ++times;
      tally = reported;
    };
  }
  int times = 0;
  AckTally tally;
};

TEST(AckLedgerTest, FlushOfNothingEndsAtOnce) {
  AckLedger ledger;
  Flushed flushed;

  ledger.flush(flushed.done());

  EXPECT_EQ(flushed.times, 1);
  EXPECT_EQ(flushed.tally, (AckTally{0, 0}));
}

TEST(AckLedgerTest, FlushEndsWithTheLastOutcome) {
  AckLedger ledger;
  const auto first = ledger.add();
  const auto second = ledger.add();
  Flushed flushed;
  ledger.flush(flushed.done());

  ledger.resolve(second, AckOutcome::kAcknowledged);
  EXPECT_EQ(flushed.times, 0);
  ledger.resolve(first, AckOutcome::kFailed);

  EXPECT_EQ(flushed.times, 1);
  EXPECT_EQ(flushed.tally, (AckTally{1, 1}));
}

TEST(AckLedgerTest, FlushReportsOutcomesThatCameBeforeIt) {
  AckLedger ledger;
  ledger.resolve(ledger.add(), AckOutcome::kAcknowledged);
  ledger.resolve(ledger.add(), AckOutcome::kFailed);
  ledger.resolve(ledger.add(), AckOutcome::kRefused);
  ledger.resolve(ledger.add(), AckOutcome::kKept);
  Flushed flushed;

  ledger.flush(flushed.done());

  EXPECT_EQ(flushed.tally, (AckTally{.acknowledged = 1, .notAcknowledged = 1, .kept = 1}));
}

TEST(AckLedgerTest, FlushDoesNotWaitForLaterMessages) {
  AckLedger ledger;
  const auto before = ledger.add();
  Flushed first;
  Flushed second;
  ledger.flush(first.done());
  const auto after = ledger.add();

  ledger.flush(second.done());
  ledger.resolve(after, AckOutcome::kAcknowledged);
  EXPECT_EQ(first.times, 0);
  EXPECT_EQ(second.times, 1);
  ledger.resolve(before, AckOutcome::kAcknowledged);

  EXPECT_EQ(first.times, 1);
  EXPECT_EQ(first.tally, (AckTally{1, 0}));
  EXPECT_EQ(second.tally, (AckTally{1, 0}));
}

TEST(AckLedgerTest, GivingUpCountsWhatIsOutstandingOnce) {
  AckLedger ledger;
  ledger.resolve(ledger.add(), AckOutcome::kAcknowledged);
  const auto late = ledger.add();
  Flushed flushed;
  const auto flush = ledger.flush(flushed.done());

  ledger.giveUp(flush);
  ledger.giveUp(flush);
  ledger.resolve(late, AckOutcome::kAcknowledged);

  EXPECT_EQ(flushed.times, 1);
  EXPECT_EQ(flushed.tally, (AckTally{1, 1}));
}

TEST(AckLedgerTest, GivingUpAFlushThatEndedDoesNothing) {
  AckLedger ledger;
  const auto message = ledger.add();
  Flushed flushed;
  const auto flush = ledger.flush(flushed.done());
  ledger.resolve(message, AckOutcome::kAcknowledged);

  ledger.giveUp(flush);

  EXPECT_EQ(flushed.times, 1);
  EXPECT_EQ(flushed.tally, (AckTally{1, 0}));
}

TEST(AckLedgerTest, LateOutcomeOfAGivenUpFlushLeavesTheNextFlushAlone) {
  AckLedger ledger;
  const auto late = ledger.add();
  Flushed first;
  ledger.giveUp(ledger.flush(first.done()));
  const auto message = ledger.add();
  Flushed second;
  ledger.flush(second.done());

  ledger.resolve(late, AckOutcome::kAcknowledged);
  EXPECT_EQ(second.times, 0);
  ledger.resolve(message, AckOutcome::kAcknowledged);

  EXPECT_EQ(second.tally, (AckTally{1, 0}));
}

}  // namespace
}  // namespace halvox::platform::linux_
