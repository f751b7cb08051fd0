#include "service/ServiceFixture.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::LogLevel;
using platform::NumberKind;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;
using namespace std::chrono_literals;

class HVReportingClientServerInstanceMessagesTest : public ServiceFixture {
 protected:
  HVReportingClientServerInstanceMessagesTest() {
    platform_.clock.setCurrentDate({1000.25});
    platform_.clock.setSystemUptime(100.5s);
    platform_.clock.setProcessUptime(4321ms);
    forgetSteps();
  }
  ~HVReportingClientServerInstanceMessagesTest() override { platform_.dispatch.clear(); }

  static Dictionary recorded(const Connection& from, std::int64_t id, std::size_t position = 0) {
    const auto session = sessionOf(from, id);
    const auto history = session->nestedAggregatedPayloadData();
    return messagesOf(**history).at(position).message;
  }
  static Dictionary stamped() {
    return {{"a", 1},
            {"hvreporting_timestamp", 1000.25},
            {"systemuptime_sec", 101},
            {"processuptime_ms", 4321}};
  }

  Connection client_ = connect(100);
  Connection other_ = connect(101);
};

TEST_F(HVReportingClientServerInstanceMessagesTest, StepsForANamedSessionInOrder) {
  createAndStart(client_, 7);
  setServiceType(client_, AudioServiceType::kHaptics, 7);
  forgetSteps();

  send(client_, {7});

  EXPECT_THAT(steps(),
              ElementsAre("sending message for reporter (7)", "0x21044824",
                          "com.tarno.halvox.Playback.Start", "com.tarno.halvox.Playback.Start",
                          "com.tarno.haptics.Playback.Start", "com.tarno.haptics.Playback.Start",
                          "sending message for session owned by 7", "0x21044838", "sendMessage"));
  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("sending message for reporter (7)",
                                                   "sending message for session owned by 7"));
  EXPECT_THAT(lines(LogLevel::kDefault), IsEmpty());
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StepsForAllActiveSessionsInTheOtherOrder) {
  createAndStart(client_, 7);
  forgetSteps();
  const std::string seven =
      "(reporterID=7,serviceName=unknown,ownerPid=100,HostApplicationDisplayID=Unknown,started=1)";

  sendToAll(client_);

  EXPECT_THAT(steps(),
              ElementsAre("sending message for reporter (null)", "0x21044824",
                          "sessions for client 100 : " + seven, "sessions for client 101 : ()",
                          "active reporting sessions 1 : " + seven,
                          "sending message for session owned by 7", "0x21044838",
                          "com.tarno.halvox.Playback.Start", "com.tarno.halvox.Playback.Start",
                          "com.tarno.unknown.Playback.Start", "com.tarno.unknown.Playback.Start",
                          "sendMessage"));
  EXPECT_EQ(lines(LogLevel::kDefault).size(), 3U);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, AllActiveSessionsOfAllClientsGetTheMessage) {
  createAndStart(client_, 7);
  createAndStart(other_, 8);
  create(other_, 9);

  sendToAll(client_);

  EXPECT_EQ(historySize(client_, 7), 1U);
  EXPECT_EQ(historySize(other_, 8), 1U);
  EXPECT_EQ(platform_.statistics.value("session", "received"), 2U);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, MessagesAreStampedOnceForAllSessions) {
  createAndStart(client_, 7);
  createAndStart(client_, 8);

  send(client_, {7, 8});

  Dictionary expected = stamped();
  expected.set("audiotag", "PlaybackStart");
  EXPECT_EQ(recorded(client_, 7), expected);
  EXPECT_EQ(recorded(client_, 8), expected);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StampsHaveTheirTypes) {
  createAndStart(client_, 7);

  send(client_, {7});

  const Dictionary message = recorded(client_, 7);
  EXPECT_EQ(message.find("hvreporting_timestamp")->numberKind(), NumberKind::kDouble);
  EXPECT_EQ(message.find("systemuptime_sec")->numberKind(), NumberKind::kInt32);
  EXPECT_EQ(message.find("processuptime_ms")->numberKind(), NumberKind::kInt64);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StampsComeLastAlwaysInTheSameOrder) {
  createAndStart(client_, 7);

  send(client_, {7}, {{"processuptime_ms", 6}, {"a", 1}});

  std::vector<std::string> keys;
  for (const auto& entry : recorded(client_, 7)) keys.emplace_back(entry.key.text());
  EXPECT_THAT(keys, ElementsAre("a", "hvreporting_timestamp", "systemuptime_sec",
                                "processuptime_ms", "audiotag"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StampsReplaceWhatTheClientSent) {
  createAndStart(client_, 7);

  send(client_, {7},
       {{"systemuptime_sec", "never"},
        {"a", 1},
        {"hvreporting_timestamp", 5},
        {"processuptime_ms", 6}});

  Dictionary expected = stamped();
  expected.set("audiotag", "PlaybackStart");
  EXPECT_EQ(recorded(client_, 7), expected);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StampsWinOverKeysThatBecomeTheirs) {
  createAndStart(client_, 7);

  send(client_, {7}, {{"hvreporting_timestamp", 1}, {"hvreporting timestamp", 2}});

  EXPECT_EQ(*recorded(client_, 7).find("hvreporting_timestamp"), Value(1000.25));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, TheStampIsTheTimeWhenTheRequestIsCarriedOut) {
  createAndStart(client_, 7);
  const std::vector<Value> ids{Array{7}};
  post(client_, "sendMessage", {Dictionary{{"a", 1}}, kCategory, kType, Array(ids)});
  platform_.clock.advance(10s);
  run();

  EXPECT_EQ(*recorded(client_, 7).find("hvreporting_timestamp"), Value(1010.25));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, BackEndsGetTheStampedMessageUncleaned) {
  createAndStart(client_, 7);

  send(client_, {7}, {{"sample rate", 1}});

  const auto payload = platform_.analytics.events("com.tarno.halvox.Playback.Start").at(0).payload;
  EXPECT_EQ(payload, (Dictionary{{"sample rate", 1},
                                 {"hvreporting_timestamp", 1000.25},
                                 {"systemuptime_sec", 101},
                                 {"processuptime_ms", 4321},
                                 {"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, TheClientsOwnCopyIsNotStamped) {
  createAndStart(client_, 7);
  const Dictionary message{{"a", 1}};

  send(client_, {7}, message);

  EXPECT_EQ(message, (Dictionary{{"a", 1}}));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, RepeatedMessagesReachTheBackEndsAllTheSame) {
  createAndStart(client_, 7);

  send(client_, {7});
  platform_.clock.advance(1s);
  send(client_, {7});

  EXPECT_EQ(historySize(client_, 7), 1U);
  EXPECT_EQ(platform_.analytics.events("com.tarno.halvox.Playback.Start").size(), 2U);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, SessionsOfOthersCanBeSentTo) {
  createAndStart(other_, 7);
  forgetSteps();

  send(client_, {7});

  EXPECT_EQ(historySize(other_, 7), 1U);
  EXPECT_THAT(lines(LogLevel::kInfo), ElementsAre("found reporting session 7 for client 101"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, AnOwnSessionIsPreferredWithoutALine) {
  createAndStart(client_, 7);
  createAndStart(other_, 7);
  forgetSteps();

  send(other_, {7});

  EXPECT_EQ(historySize(client_, 7), 0U);
  EXPECT_EQ(historySize(other_, 7), 1U);
  EXPECT_THAT(lines(LogLevel::kInfo), IsEmpty());
}

TEST_F(HVReportingClientServerInstanceMessagesTest, ZeroAndUnknownIDsAreSkipped) {
  createAndStart(client_, 7);
  platform_.analytics.clear();

  EXPECT_THAT(send(client_, {0, 99})->replies(), ElementsAre(ok(Value())));

  EXPECT_THAT(platform_.analytics.testedNames(), IsEmpty());
  EXPECT_EQ(historySize(client_, 7), 0U);
  EXPECT_EQ(platform_.statistics.value("messages", "dropped: no session found"), 1U);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, AnIDThatOccursTwiceIsHandledTwice) {
  createAndStart(client_, 7);
  forgetSteps();

  send(client_, {7, 7});

  EXPECT_EQ(platform_.analytics.events("com.tarno.halvox.Playback.Start").size(), 2U);
  EXPECT_TRUE(platform_.log.containsText("dropping redundant event"));
  EXPECT_TRUE(platform_.log.containsText("sending message for reporter (7, 7)"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, SessionsAreHandledInTheOrderNamed) {
  createAndStart(client_, 7);
  createAndStart(client_, 8);
  forgetSteps();

  send(client_, {8, 0, 99, 7});

  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("sending message for reporter (8, 0, 99, 7)",
                                                   "sending message for session owned by 8",
                                                   "sending message for session owned by 7"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, IDZeroIsSkippedThoughASessionHasIt) {
  create(client_, 0);
  forgetSteps();

  send(client_, {0});

  EXPECT_THAT(lines(LogLevel::kDebug), ElementsAre("sending message for reporter (0)"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, ANamedSessionNeedNotBeStarted) {
  create(client_, 7);

  send(client_, {7});
  EXPECT_EQ(platform_.analytics.events("com.tarno.halvox.Playback.Start").size(), 1U);
  EXPECT_EQ(platform_.dispatch.delayedJobs(), 1U);  // the link sends it as a single message
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StandaloneStepsInOrder) {
  platform_.analytics.setBuilding(platform::FakeAnalyticsService::Building::kWhenSent);
  create(client_, 7);
  forgetSteps();

  EXPECT_THAT(sendToAll(client_)->replies(), ElementsAre(ok(Value())));

  EXPECT_THAT(
      steps(),
      ElementsAre("sending message for reporter (null)", "0x21044824",
                  "sessions for client 100 : (reporterID=7,serviceName=unknown,ownerPid=100,"
                  "HostApplicationDisplayID=Unknown,started=0)",
                  "sessions for client 101 : ()", "active reporting sessions 0 : ()",
                  "created reporting session for ID: 1", "0x21044828",
                  "setting service type standalone", "com.tarno.halvox.Playback.Start",
                  "com.tarno.halvox.Playback.Start", "com.tarno.standalone.Playback.Start",
                  "com.tarno.standalone.Playback.Start",
                  "no active reporting sessions found, sending as standalone",
                  "sending single message after delta 0 for service 5", "0x21044834",
                  "deallocing this session 1", "sendMessage"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StandaloneIsANotableEvent) {
  sendToAll(client_);

  EXPECT_THAT(lines(LogLevel::kDefault),
              testing::Contains("no active reporting sessions found, sending as standalone"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StandaloneSendsOneSingleMessageASecondLater) {
  platform_.analytics.setBuilding(platform::FakeAnalyticsService::Building::kWhenSent);
  sendToAll(client_);
  EXPECT_THAT(platform_.dispatch.delays(), ElementsAre(std::chrono::nanoseconds(1s)));
  forgetSteps();

  platform_.dispatch.advance(1s);

  EXPECT_THAT(steps(), ElementsAre("0x21044838", "sending single message",
                                   testing::StartsWith("message {a = 1; ")));
  EXPECT_EQ(platform_.tlmReporting.singleMessages().size(), 1U);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, StandaloneBackEndsSeeOneStampedMessage) {
  sendToAll(client_);

  const auto events = platform_.analytics.events("com.tarno.standalone.Playback.Start");
  ASSERT_EQ(events.size(), 1U);
  Dictionary expected = stamped();
  expected.set("HostApplicationDisplayID", "Unknown");
  EXPECT_EQ(events[0].payload, expected);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, TheStandaloneSessionIsTheServicesOwn) {
  platform_.analytics.setBuilding(platform::FakeAnalyticsService::Building::kWhenTold);
  sendToAll(client_);

  EXPECT_TRUE(clientOf(client_)->clientReportingSessionMap().empty());
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{1}), nullptr);
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
  EXPECT_FALSE(platform_.log.containsText("deallocing this session 1"));  // payloads hold it

  platform_.analytics.clear();
  EXPECT_TRUE(platform_.log.containsText("deallocing this session 1"));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, WhileDisabledMessagesAreAnsweredWithAnError) {
  createAndStart(client_, 7);
  delegate_->setReportingEnabled(false);
  forgetSteps();

  const Call call = send(client_, {7});

  const platform::Error expected{.domain = "com.tarno.audio.reporting", .code = 1};
  ASSERT_EQ(call->replies().size(), 1U);
  EXPECT_EQ(call->replies()[0].error, expected);
  EXPECT_THAT(steps(),
              ElementsAre("sending message for reporter (7)", "0x21044824", "sendMessage"));
  EXPECT_EQ(historySize(client_, 7), 0U);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, EveryMessageIsAccountedFor) {
  createAndStart(client_, 7);
  send(client_, {7});
  send(client_, {99});
  sendToAll(client_);
  delegate_->setReportingEnabled(false);
  send(client_, {7});

  EXPECT_THAT(platform_.statistics.values("messages"),
              UnorderedElementsAre(Pair("received", 4U), Pair("delivered", 2U),
                                   Pair("dropped: no session found", 1U),
                                   Pair("refused: reporting disabled", 1U)));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, NoSenderIsLookedUpWhereNothingIsCaptured) {
  constexpr std::uint16_t kJoulebook = 8;
  createAndStart(client_, 7);
  const std::size_t before = platform_.process.lookUps();

  for (int message = 0; message < 100; ++message) {
    send(client_, {7});
    sendToAll(other_);
    call(client_, "sendMessage", {Dictionary{}, kCategory, kJoulebook, Array{}});
  }

  EXPECT_EQ(platform_.process.lookUps(), before);
}

TEST_F(HVReportingClientServerInstanceMessagesTest, AStandaloneMessageCountsAsDelivered) {
  sendToAll(client_);

  EXPECT_THAT(platform_.statistics.values("messages"),
              UnorderedElementsAre(Pair("received", 1U), Pair("delivered", 1U)));
}

TEST_F(HVReportingClientServerInstanceMessagesTest, AHistoryIsChargedToTheClientWhoseSessionItIs) {
  createAndStart(client_, 7);
  const auto before = clientOf(client_)->resourceUse().bytes;

  send(other_, {7});

  EXPECT_GT(clientOf(client_)->resourceUse().bytes, before);
  EXPECT_EQ(clientOf(other_)->resourceUse().bytes, 0U);
}

}  // namespace
}  // namespace halvox
