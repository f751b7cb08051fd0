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
#include "session/SessionCounters.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::JournalEntry;
using platform::JournalKind;
using platform::LogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

class SingleMessageTest : public testing::Test {
 protected:
  ~SingleMessageTest() override { platform_.dispatch.clear(); }

  void send(AudioServiceType serviceType, const Dictionary& message = {{"a", 1}},
            const ErrorReply& reply = nullptr) {
    HVReportingSession::sendSingleMessage(message, AudioEventCategory::kPlayback,
                                          AudioEventType::kStart, serviceType, {{"ignored", true}},
                                          reply, nullptr, counters_);
  }
  static int delta(const std::string& line) {
    int value = -1;
    const std::string_view prefix = "sending single message after delta ";
    std::from_chars(line.data() + prefix.size(), line.data() + line.size(), value);
    return value;
  }

  platform::FakePlatform platform_;
  const SessionCounters counters_{platform_.statistics};
};

TEST_F(SingleMessageTest, LogsADeltaOfZeroForOtherServicesThanAlarms) {
  send(AudioServiceType::kStandalone);

  EXPECT_THAT(platform_.log.texts(LogLevel::kDebug),
              ElementsAre("sending single message after delta 0 for service 5"));
}

TEST_F(SingleMessageTest, IsSentAfterOneSecondOnTheBackgroundQueue) {
  send(AudioServiceType::kHaptics);
  platform_.journal.clear();

  platform_.dispatch.advance(999ms);
  EXPECT_THAT(platform_.journal.entries(), IsEmpty());

  platform_.dispatch.advance(1ms);
  EXPECT_THAT(
      platform_.journal.entries(),
      ElementsAre(JournalEntry{JournalKind::kTracePoint, "0x21044838"},
                  JournalEntry{JournalKind::kLogLine, "sending single message"},
                  JournalEntry{JournalKind::kLink, "send single 4/1"},
                  JournalEntry{JournalKind::kLogLine, "message {a = 1} : category 4 : type 1"}));
  EXPECT_EQ(platform_.log.lines().back().level, LogLevel::kDebug);
}

TEST_F(SingleMessageTest, AlarmsDrawADeltaBelowAMinute) {
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

// With so many draws, one of the sixty values is missing once in 10^35 runs.
TEST_F(SingleMessageTest, AlarmsDrawEachSecondOfAMinute) {
  for (int round = 0; round < 5000; ++round) send(AudioServiceType::kAlarms);

  std::set<int> deltas;
  for (const std::string& line : platform_.log.texts(LogLevel::kDebug)) deltas.insert(delta(line));
  EXPECT_EQ(deltas.size(), 60U);
  EXPECT_EQ(*deltas.begin(), 0);
  EXPECT_EQ(*deltas.rbegin(), 59);
}

TEST_F(SingleMessageTest, AlarmsAlwaysWaitOneSecond) {
  for (int round = 0; round < 50; ++round) send(AudioServiceType::kAlarms);

  const auto delays = platform_.dispatch.delays();
  EXPECT_EQ(std::ranges::count(delays, std::chrono::nanoseconds(1s)), 50);
}

TEST_F(SingleMessageTest, RepliesWithNoErrorWhenItWasSent) {
  std::vector<std::optional<platform::Error>> replies;
  send(AudioServiceType::kHaptics, {}, [&](const auto& error) { replies.push_back(error); });
  EXPECT_THAT(replies, IsEmpty());

  platform_.dispatch.advance(1s);

  EXPECT_THAT(replies, ElementsAre(std::nullopt));
}

TEST_F(SingleMessageTest, EveryMessageIsAccountedFor) {
  send(AudioServiceType::kHaptics);
  send(AudioServiceType::kHaptics);
  platform_.dispatch.advance(1s);
  platform_.tlmReporting.setOutcome({.sent = false});
  send(AudioServiceType::kHaptics);
  platform_.dispatch.advance(1s);

  EXPECT_THAT(
      platform_.statistics.values("single messages"),
      testing::UnorderedElementsAre(testing::Pair("received", 3U), testing::Pair("sent", 2U),
                                    testing::Pair("failed", 1U)));
}

TEST_F(SingleMessageTest, HasNoSessionInItsSessionInfo) {
  send(AudioServiceType::kHaptics);
  platform_.dispatch.advance(1s);

  const auto infos = platform_.tlmReporting.singleMessageInfos();
  ASSERT_EQ(infos.size(), 1U);
  EXPECT_EQ(infos[0].sessionInfo, (Dictionary{{"TLMReportingSessionInfoClientType", 19},
                                              {"TLMReportingSessionInfoClientVersion", 2.1},
                                              {"TLMReportingSessionInfoSessionID", -1}}));
}

TEST_F(SingleMessageTest, NamesTheServiceInItsUserInfoAndNothingElseOfTheSession) {
  send(AudioServiceType::kHaptics);
  platform_.dispatch.advance(1s);

  const auto infos = platform_.tlmReporting.singleMessageInfos();
  ASSERT_EQ(infos.size(), 1U);
  EXPECT_EQ(infos[0].userInfo, (Dictionary{{"TLMReportingUserInfoClientName", "com.tarno.halvox"},
                                           {"TLMReportingUserInfoServiceName", "haptics"}}));
}

TEST_F(SingleMessageTest, SendsCleanKeysAndTheCategoryWithoutItsDomain) {
  HVReportingSession::sendSingleMessage(
      Dictionary{{"sample rate", 48000}}, AudioEventCategory::kToolbox | AudioEventCategory::kError,
      AudioEventType::kState, AudioServiceType::kHaptics, {}, nullptr, nullptr, counters_);
  platform_.dispatch.advance(1s);

  const auto sent = platform_.tlmReporting.singleMessages();
  ASSERT_EQ(sent.size(), 1U);
  EXPECT_EQ(sent[0].category, 11);
  EXPECT_EQ(sent[0].type, 18);
  EXPECT_EQ(sent[0].payload, (Dictionary{{"sample_rate", 48000}}));
  EXPECT_TRUE(
      platform_.log.containsText("message {sample rate = 48000} : category -2147483637 : type 18"));
}

TEST_F(SingleMessageTest, NoMessageAtAllIsSentEmpty) {
  HVReportingSession::sendSingleMessage(std::nullopt, AudioEventCategory::kPlayback,
                                        AudioEventType::kStart, AudioServiceType::kHaptics, {},
                                        nullptr, nullptr, counters_);
  platform_.dispatch.advance(1s);

  ASSERT_EQ(platform_.tlmReporting.singleMessages().size(), 1U);
  EXPECT_TRUE(platform_.tlmReporting.singleMessages()[0].payload.empty());
  EXPECT_TRUE(platform_.log.containsText("message (null) : category 4 : type 1"));
}

TEST_F(SingleMessageTest, AFailureWithAnErrorIsLoggedAndReplied) {
  const platform::Error error{.domain = "link", .code = 3, .description = "no route"};
  platform_.tlmReporting.setOutcome({.sent = false, .error = error});
  std::vector<std::optional<platform::Error>> replies;

  send(AudioServiceType::kHaptics, {}, [&](const auto& given) { replies.push_back(given); });
  platform_.dispatch.advance(1s);

  EXPECT_THAT(platform_.log.texts(LogLevel::kError),
              ElementsAre("sendOneMessageWithSessionInfo no route"));
  EXPECT_THAT(replies, ElementsAre(error));
}

TEST_F(SingleMessageTest, ABurstOfFailuresGetsOneLineAndEachItsReply) {
  const platform::Error error{.domain = "link", .code = 3, .description = "no route"};
  platform_.tlmReporting.setOutcome({.sent = false, .error = error});
  std::vector<std::optional<platform::Error>> replies;

  for (int number = 0; number < 3; ++number) {
    send(AudioServiceType::kHaptics, {}, [&](const auto& given) { replies.push_back(given); });
  }
  platform_.dispatch.advance(1s);

  EXPECT_THAT(platform_.log.texts(LogLevel::kError),
              ElementsAre("sendOneMessageWithSessionInfo no route"));
  EXPECT_THAT(replies, ElementsAre(error, error, error));
}

TEST_F(SingleMessageTest, AFailureWithoutAnErrorIsSilentAndRepliedWithNone) {
  platform_.tlmReporting.setOutcome({.sent = false});
  std::vector<std::optional<platform::Error>> replies;

  send(AudioServiceType::kHaptics, {}, [&](const auto& given) { replies.push_back(given); });
  platform_.dispatch.advance(1s);

  EXPECT_EQ(platform_.log.texts().back(), "sending single message");
  EXPECT_THAT(replies, ElementsAre(std::nullopt));
}

TEST_F(SingleMessageTest, AnyNumberMayWaitAndAllGoOut) {
  platform_.log.setLevel(LogLevel::kError);
  const Dictionary large{{"a", std::string(1024 * 1024, 'x')}};

  for (int round = 0; round < 100; ++round) send(AudioServiceType::kHaptics, large);
  EXPECT_EQ(platform_.dispatch.delayedJobs(), 100U);
  platform_.dispatch.advance(1s);

  EXPECT_EQ(platform_.tlmReporting.singleMessages().size(), 100U);
  EXPECT_THAT(platform_.log.texts(LogLevel::kError), IsEmpty());
}

TEST_F(SingleMessageTest, IsChargedToItsSenderUntilTheFrameworkTookIt) {
  const auto sender = std::make_shared<ResourceAccount>();
  std::uint64_t whenTaken = 0;
  const ErrorReply reply = [&](const auto&) { whenTaken = sender->use().bytes; };

  HVReportingSession::sendSingleMessage(Dictionary{{"a", std::string(1000, 'x')}},
                                        AudioEventCategory::kPlayback, AudioEventType::kStart,
                                        AudioServiceType::kHaptics, {}, reply, sender, counters_);
  const std::uint64_t whileWaiting = sender->use().bytes;
  platform_.dispatch.advance(1s);

  EXPECT_GE(whileWaiting, 1000U);
  EXPECT_EQ(whenTaken, whileWaiting);
  EXPECT_EQ(sender->use().bytes, 0U);
}

TEST_F(SingleMessageTest, IsSentAfterItsSenderHasLeft) {
  auto sender = std::make_shared<ResourceAccount>();
  const std::weak_ptr<ResourceAccount> watched = sender;
  HVReportingSession::sendSingleMessage(Dictionary{{"a", 1}}, AudioEventCategory::kPlayback,
                                        AudioEventType::kStart, AudioServiceType::kHaptics, {},
                                        nullptr, sender, counters_);

  sender.reset();
  EXPECT_FALSE(watched.expired());
  platform_.dispatch.advance(1s);

  EXPECT_EQ(platform_.tlmReporting.singleMessages().size(), 1U);
  EXPECT_TRUE(watched.expired());
}

}  // namespace
}  // namespace halvox
