#include <algorithm>
#include <charconv>
#include <chrono>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::JournalEntry;
using platform::JournalKind;
using platform::LogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

class HVReportingSessionSingleMessageTest : public testing::Test {
 protected:
  ~HVReportingSessionSingleMessageTest() override { platform_.dispatch.clear(); }

  static void send(AudioServiceType serviceType, const Dictionary& message = {{"a", 1}},
                   const ErrorReply& reply = nullptr) {
    HVReportingSession::sendSingleMessage(message, AudioEventCategory::kPlayback,
                                          AudioEventType::kStart, serviceType, {{"ignored", true}},
                                          reply);
  }
  static int delta(const std::string& line) {
    int value = -1;
    const std::string_view prefix = "sending single message after delta ";
    std::from_chars(line.data() + prefix.size(), line.data() + line.size(), value);
    return value;
  }

  platform::FakePlatform platform_;
};

TEST_F(HVReportingSessionSingleMessageTest, LogsADeltaOfZeroForOtherServicesThanAlarms) {
  send(AudioServiceType::kStandalone);

  EXPECT_THAT(platform_.log.texts(LogLevel::kDebug),
              ElementsAre("sending single message after delta 0 for service 5"));
}

TEST_F(HVReportingSessionSingleMessageTest, GoesOutAfterOneSecondOnTheBackgroundQueue) {
  send(AudioServiceType::kHaptics);
  platform_.journal.clear();

  platform_.dispatch.advance(999ms);
  EXPECT_THAT(platform_.journal.entries(), IsEmpty());

  platform_.dispatch.advance(1ms);
  EXPECT_THAT(platform_.journal.entries(),
              ElementsAre(JournalEntry{JournalKind::kTracePoint, "0x21044838"},
                          JournalEntry{JournalKind::kLogLine, "sending single message"}));
  EXPECT_EQ(platform_.log.lines().back().level, LogLevel::kDebug);
}

TEST_F(HVReportingSessionSingleMessageTest, AlarmsDrawADeltaBelowAMinute) {
  for (int round = 0; round < 200; ++round) send(AudioServiceType::kAlarms);

  std::set<int> deltas;
  for (const std::string& line : platform_.log.texts(LogLevel::kDebug)) {
    EXPECT_TRUE(line.ends_with(" for service 4"));
    deltas.insert(delta(line));
  }
  EXPECT_GE(*deltas.begin(), 0);
  EXPECT_LE(*deltas.rbegin(), 59);
  EXPECT_GT(deltas.size(), 10U);
}

TEST_F(HVReportingSessionSingleMessageTest, AlarmsWaitOneSecondWhateverTheDelta) {
  for (int round = 0; round < 50; ++round) send(AudioServiceType::kAlarms);

  const auto delays = platform_.dispatch.delays();
  EXPECT_EQ(std::ranges::count(delays, std::chrono::nanoseconds(1s)), 50);
}

TEST_F(HVReportingSessionSingleMessageTest, RepliesWithNoErrorWhenItWasSent) {
  std::vector<std::optional<platform::Error>> replies;
  send(AudioServiceType::kHaptics, {}, [&](const auto& error) { replies.push_back(error); });
  EXPECT_THAT(replies, IsEmpty());

  platform_.dispatch.advance(1s);

  EXPECT_THAT(replies, ElementsAre(std::nullopt));
}

TEST_F(HVReportingSessionSingleMessageTest, EveryMessageIsAccountedFor) {
  send(AudioServiceType::kHaptics);
  send(AudioServiceType::kHaptics);
  platform_.dispatch.advance(1s);

  EXPECT_EQ(platform_.statistics.value("single messages", "received"), 2U);
  EXPECT_EQ(platform_.statistics.value("single messages", "dropped: no real-time framework"), 2U);
}

TEST_F(HVReportingSessionSingleMessageTest, AFloodIsDroppedPastABoundAndLoggedOnce) {
  const Dictionary large{{"a", std::string(1024 * 1024, 'x')}};
  std::vector<std::optional<platform::Error>> replies;
  const ErrorReply reply = [&](const auto& error) { replies.push_back(error); };

  for (int round = 0; round < 40; ++round) send(AudioServiceType::kHaptics, large, reply);

  const auto dropped = platform_.statistics.value("single messages", "dropped: too many waiting");
  EXPECT_EQ(platform_.dispatch.delayedJobs() + dropped, 40U);
  EXPECT_GE(dropped, 8U);
  EXPECT_EQ(replies.size(), dropped);
  EXPECT_TRUE(std::ranges::all_of(replies, [](const auto& error) { return error.has_value(); }));
  EXPECT_THAT(platform_.log.texts(LogLevel::kError),
              ElementsAre("too many single messages are waiting, dropping some"));
}

TEST_F(HVReportingSessionSingleMessageTest, ThereIsRoomAgainAfterAFlood) {
  const Dictionary large{{"a", std::string(1024 * 1024, 'x')}};
  for (int round = 0; round < 40; ++round) send(AudioServiceType::kHaptics, large);
  platform_.dispatch.advance(1s);

  send(AudioServiceType::kHaptics, large);

  EXPECT_EQ(platform_.dispatch.delayedJobs(), 1U);
}

}  // namespace
}  // namespace halvox
