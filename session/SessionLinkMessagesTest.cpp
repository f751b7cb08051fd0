#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/LinkFixture.h"

namespace halvox::link_test {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;
using namespace std::chrono_literals;

class SessionLinkMessagesTest : public LinkFixture {};

TEST_F(SessionLinkMessagesTest, MessagesThatWaitedAreSentInOrder) {
  holdDiscoveries();
  start();
  send({{"a", 1}});
  send({{"a", 2}});
  send({{"a", 3}});
  run();
  EXPECT_THAT(framework_.messages(), IsEmpty());

  framework_.answerDiscovery(kServers);
  run();

  EXPECT_THAT(payloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}},
                                      Dictionary{{"a", 2}, {"audiotag", "PlaybackStart"}},
                                      Dictionary{{"a", 3}, {"audiotag", "PlaybackStart"}}));
}

// A framework that only notes messages, and queues that threads may enter. The service has both in
// its default configuration.
class SessionLinkAtOnceTest : public LinkFixture {
 protected:
  SessionLinkAtOnceTest() {
    platform_.dispatch.letThreadsEnter();
    framework_.setOnlyNotesMessages(true);
  }
};

TEST_F(SessionLinkAtOnceTest, AMessageOfAnIdleLinkNeedsNoJob) {
  open();

  send({{"a", 1}});

  EXPECT_THAT(payloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 0U);
  EXPECT_EQ(platform_.statistics.value("link", "sent"), 1U);
}

TEST_F(SessionLinkAtOnceTest, AMessageWithoutBackEndsIsDroppedWithoutAJob) {
  framework_.answerDiscoveries(Fake::Answering::kLater, std::nullopt);
  start();

  send({{"a", 1}});

  EXPECT_EQ(platform_.dispatch.waitingJobs(), 0U);
  EXPECT_EQ(platform_.statistics.value("link", "dropped: no back-end"), 1U);
}

TEST_F(SessionLinkAtOnceTest, MessagesComeAfterThoseThatWait) {
  holdDiscoveries();
  start();
  send({{"a", 1}});
  run();
  framework_.answerDiscovery(kServers);
  send({{"a", 2}});
  EXPECT_THAT(framework_.messages(), IsEmpty());

  run();
  send({{"a", 3}});

  EXPECT_THAT(payloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}},
                                      Dictionary{{"a", 2}, {"audiotag", "PlaybackStart"}},
                                      Dictionary{{"a", 3}, {"audiotag", "PlaybackStart"}}));
}

TEST_F(SessionLinkAtOnceTest, TheReplyComesBeforeTheFrameworkHasTheMessage) {
  open();
  std::vector<std::size_t> sentBefore;

  session_->sendMessage(Dictionary{{"a", 1}}, kPlayback, kStart, [&](const auto& /*error*/) {
    sentBefore.push_back(framework_.messages().size());
  });
  run();

  EXPECT_THAT(sentBefore, ElementsAre(0U));
  EXPECT_EQ(framework_.messages().size(), 1U);
}

TEST_F(SessionLinkAtOnceTest, AFrameworkThatDoesMoreThanNoteMessagesGetsThemFromAJob) {
  framework_.setOnlyNotesMessages(false);
  open();

  send({{"a", 1}});

  EXPECT_THAT(framework_.messages(), IsEmpty());
  run();
  EXPECT_EQ(framework_.messages().size(), 1U);
}

TEST_F(SessionLinkAtOnceTest, AMessageOutsideARunIsASingleMessage) {
  send({{"a", 1}});
  platform_.dispatch.advance(1s);
  EXPECT_EQ(framework_.singleMessages().size(), 1U);
}

TEST_F(SessionLinkMessagesTest, MessagesThatWaitedInVainAreDroppedWithoutALine) {
  holdDiscoveries();
  start();
  send({{"a", 1}});
  platform_.log.clear();

  platform_.dispatch.advance(9s);

  EXPECT_THAT(platform_.log.texts(), ElementsAre(kTimedOut.second, kMessageEntered));
  EXPECT_THAT(framework_.messages(), IsEmpty());
  EXPECT_EQ(platform_.statistics.value("link", "dropped: no back-end"), 1U);
}

TEST_F(SessionLinkMessagesTest, ASentMessageIsLoggedAsTheClientGaveIt) {
  open();
  platform_.log.clear();

  send({{"sample rate", 48000}}, AudioEventCategory::kToolbox | kPlayback);
  run();

  const auto sent = framework_.messages().at(0);
  EXPECT_EQ(sent.category, 4);
  EXPECT_EQ(sent.type, 1);
  EXPECT_EQ(sent.payload,
            (Dictionary{{"sample_rate", 48000}, {"audiotag", "Toolbox_PlaybackStart"}}));
  EXPECT_THAT(platform_.log.texts(LogLevel::kDebug),
              ElementsAre("sending message for session owned by 7", kMessageEntered,
                          "TLMReportingAgent session 1 : message {sample rate = 48000} : category "
                          "-2147483644 : type 1"));
  EXPECT_EQ(platform_.log.lines().back().category, "hvrr");
}

TEST_F(SessionLinkMessagesTest, AFailureWithAnErrorIsLoggedAndNotRetried) {
  open();
  framework_.setOutcome({.sent = false, .error = platform::Error{.description = "no route"}});
  platform_.log.clear();

  send({{"a", 1}});
  run();

  EXPECT_THAT(platform_.log.texts(LogLevel::kError), ElementsAre("error sending message no route"));
  EXPECT_EQ(platform_.log.lines().back().category, "hvrr");
  EXPECT_EQ(framework_.messages().size(), 1U);
}

TEST_F(SessionLinkMessagesTest, ABurstOfFailuresGetsOneLineAndIsCounted) {
  open();
  framework_.setOutcome({.sent = false, .error = platform::Error{.description = "no route"}});
  platform_.log.clear();

  for (int number = 0; number < 100; ++number) send({{"a", number}});
  run();

  EXPECT_THAT(platform_.log.texts(LogLevel::kError), ElementsAre("error sending message no route"));
  EXPECT_EQ(platform_.statistics.value("link", "failed"), 100U);
}

TEST_F(SessionLinkMessagesTest, AFailureWithoutAnErrorIsSilent) {
  open();
  framework_.setOutcome({.sent = false});
  platform_.log.clear();

  send({{"a", 1}});
  run();

  EXPECT_EQ(platform_.log.texts().back(), kMessageEntered);
  EXPECT_EQ(platform_.statistics.value("link", "failed"), 1U);
}

TEST_F(SessionLinkMessagesTest, ARedundantMessageIsNotSent) {
  open();

  send({{"a", 1}});
  send({{"a", 1}});
  run();

  EXPECT_EQ(framework_.messages().size(), 1U);
  EXPECT_EQ(platform_.statistics.value("link", "suppressed: redundant"), 1U);
}

TEST_F(SessionLinkMessagesTest, ATestSessionThatIsNotStartedSendsASingleMessage) {
  session_->setServiceType(AudioServiceType::kTest);

  send({{"a", 1}});
  run();
  platform_.dispatch.advance(1s);

  ASSERT_EQ(framework_.singleMessages().size(), 1U);
  EXPECT_EQ(framework_.singleMessages()[0].payload,
            (Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
  EXPECT_EQ(*framework_.singleMessageInfos().at(0).userInfo.find("TLMReportingUserInfoServiceName"),
            platform::Value("test"));
  EXPECT_THAT(platform_.statistics.values("link"),
              UnorderedElementsAre(Pair("received", 1U), Pair("passed on: single message", 1U)));
}

TEST_F(SessionLinkMessagesTest, ASessionThatBecameATestSendsNoMore) {
  open();
  session_->setServiceType(AudioServiceType::kTest);

  send({{"a", 1}});
  run();

  EXPECT_THAT(framework_.messages(), IsEmpty());
}

// The counters give the reason why a message was not sent. If there are several reasons, the first
// one in this order is counted.
TEST_F(SessionLinkMessagesTest, ARepeatCountsAsOneThoughTheLinkIsDown) {
  start();  // finds no server

  send({{"a", 1}});
  send({{"a", 1}});
  run();

  EXPECT_THAT(platform_.statistics.values("link"),
              UnorderedElementsAre(Pair("received", 2U), Pair("suppressed: redundant", 1U),
                                   Pair("dropped: no back-end", 1U)));
}

TEST_F(SessionLinkMessagesTest, ARepeatOfATestSessionCountsAsOneOfATestSession) {
  open();
  session_->setServiceType(AudioServiceType::kTest);

  send({{"a", 1}});
  send({{"a", 1}});
  run();

  EXPECT_THAT(platform_.statistics.values("link"),
              UnorderedElementsAre(Pair("received", 2U), Pair("dropped: test session", 2U)));
}

TEST_F(SessionLinkMessagesTest, TheReplyComesAtOnceThoughTheLinkFailsLater) {
  open();
  framework_.setOutcome({.sent = false, .error = platform::Error{.description = "no route"}});
  std::vector<std::optional<platform::Error>> replies;

  session_->sendMessage(Dictionary{{"a", 1}}, kPlayback, kStart,
                        [&replies](const auto& error) { replies.push_back(error); });

  EXPECT_THAT(replies, ElementsAre(std::nullopt));
  run();
  EXPECT_EQ(replies.size(), 1U);
}

TEST_F(SessionLinkMessagesTest, BeforeTheStartAMessageIsASingleOne) {
  send({{"a", 1}});
  platform_.dispatch.advance(1s);

  const auto sent = framework_.singleMessages();
  ASSERT_EQ(sent.size(), 1U);
  EXPECT_EQ(sent[0].payload, (Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
  const Dictionary info = framework_.singleMessageInfos().at(0).sessionInfo;
  EXPECT_EQ(*info.find("TLMReportingSessionInfoSessionID"), platform::Value(-1));
  EXPECT_EQ(*info.find("TLMReportingSessionInfoClientType"), platform::Value(19));
}

// The state at the moment of sending decides, not the state when the job runs.
TEST_F(SessionLinkMessagesTest, AMessageOfAStartedSessionIsNotASingleOneEvenIfTheStopOvertakes) {
  framework_.answerDiscoveries(Fake::Answering::kLater, kServers);
  session_->start();
  send({{"a", 1}});
  session_->stop();

  run();

  EXPECT_EQ(framework_.messages().size(), 2U);  // one is the summary event
  EXPECT_THAT(framework_.singleMessages(), IsEmpty());
  EXPECT_EQ(platform_.dispatch.delayedJobs(), 0U);
}

TEST_F(SessionLinkMessagesTest, EveryMessageIsAccountedFor) {
  send({{"a", 0}});  // single
  run();
  start();
  send({{"a", 1}});  // no back-end
  run();
  stop();  // with a summary event
  open();
  send({{"a", 1}});
  send({{"a", 1}});  // redundant
  run();
  framework_.setOutcome({.sent = false});
  send({{"a", 2}});  // failed
  run();

  EXPECT_THAT(
      platform_.statistics.values("link"),
      UnorderedElementsAre(Pair("received", 6U), Pair("sent", 1U), Pair("failed", 1U),
                           Pair("passed on: single message", 1U), Pair("suppressed: redundant", 1U),
                           Pair("dropped: no back-end", 2U)));
}

TEST_F(SessionLinkMessagesTest, WaitingStartsAndStopsAreChargedWithTheirConfiguration) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();

  for (int count = 0; count < 10; ++count) {
    session_->updateConfigurationWithContentsOfConfiguration({{"a", std::string(10'000, 'x')}});
    session_->stop();
    session_->start();
  }
  EXPECT_GE(account->use().bytes, std::size_t{10} * 10'000);

  session_->stop();
  for (int count = 0; count < 11; ++count) platform_.dispatch.advance(9s);
  EXPECT_EQ(account->use().bytes, session_->configuration().memorySize());
}

TEST_F(SessionLinkMessagesTest, WhatWaitsIsChargedToTheClientUntilItWasSent) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();

  for (int count = 0; count < 10; ++count) send({{"a", std::string(1000, 'x')}, {"n", count}});
  const std::size_t history = (*session_->nestedAggregatedPayloadData())->memorySize();
  EXPECT_GE(account->use().bytes, history + std::size_t{10} * 1000);

  framework_.answerDiscovery(kServers);
  run();
  EXPECT_EQ(account->use().bytes, history);
}

TEST_F(SessionLinkMessagesTest, RedundantMessagesThatWaitAreChargedToo) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();
  send({{"a", 1}});
  const std::size_t before = account->use().bytes;

  for (int count = 0; count < 10; ++count) send({{"a", 1}});

  EXPECT_GE(account->use().bytes, before + std::size_t{10} * sizeof(Dictionary::Entry));
}

TEST_F(SessionLinkMessagesTest, WhatATagReplacedIsChargedWhileItWaits) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();

  send({{"audiotag", std::string(100'000, 'x')}});

  EXPECT_GE(account->use().bytes, 100'000U);
}

TEST_F(SessionLinkMessagesTest, WaitingMessagesStayChargedWhenTheSessionIsStopped) {
  const auto account = std::make_shared<ResourceAccount>();
  session_->chargeTo(account);
  holdDiscoveries();
  start();
  send({{"a", std::string(1000, 'x')}});

  session_->stop();
  EXPECT_GE(account->use().bytes, 1000U);

  session_.reset();
  platform_.dispatch.advance(9s);
  EXPECT_EQ(account->use().bytes, 0U);
}

}  // namespace
}  // namespace halvox::link_test
