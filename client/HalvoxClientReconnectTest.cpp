#include <algorithm>
#include <atomic>
#include <chrono>
#include <numeric>
#include <string>
#include <thread>
#include <vector>

#include "client/HalvoxClientFixture.h"

namespace halvox::client {
namespace {

using namespace std::chrono_literals;

class HalvoxClientReconnectTest : public HalvoxClientFixture {};

TEST_F(HalvoxClientReconnectTest, MessagesWaitForAServiceThatIsNotThereYet) {
  service_.vanish();
  HalvoxClient client(options());
  client.createSession(7);
  client.send(7, {{"n", 1}}, kPlayback, kStart);

  EXPECT_FALSE(client.flush(30ms));
  EXPECT_FALSE(client.isConnected());
  service_.come();

  // Both flushes wait for the same answer, because no message was sent between them.
  EXPECT_TRUE(client.flush(kPatience));
  EXPECT_EQ(service_.members(), "createReportingSession sendMessage reporterIDValid");
}

TEST_F(HalvoxClientReconnectTest, MakesItsSessionsAgainBeforePendingMessagesFlow) {
  HalvoxClient client(options());
  client.createSession(7);
  client.setServiceType(7, 2);
  client.setConfiguration(7, {{"a", 1}});
  client.setConfiguration(7, {{"b", 2}});
  client.start(7);
  client.createSession(8);
  ASSERT_TRUE(client.flush(kPatience));
  const std::size_t before = service_.calls().size();

  service_.vanish();
  ASSERT_TRUE(eventually([&] { return !client.isConnected(); }));
  client.send(7, {{"n", 1}}, kPlayback, kStart);
  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  const auto calls = service_.calls();
  std::string members;
  for (std::size_t index = before; index < calls.size(); ++index)
    members += calls[index].member + " ";
  EXPECT_EQ(members,
            "createReportingSession setServiceType setConfiguration startReportingSessionForID "
            "createReportingSession sendMessage reporterIDValid ");
  EXPECT_EQ(calls.at(before + 2).arguments.front(), Value(Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_EQ(client.counters().reconnects, 1U);
}

TEST_F(HalvoxClientReconnectTest, SessionStepsTakenWhileTheServiceWasAwayFollowTheirMessages) {
  HalvoxClient client(options());
  client.createSession(7);
  client.start(7);
  ASSERT_TRUE(client.flush(kPatience));
  service_.vanish();
  ASSERT_TRUE(eventually([&] { return !client.isConnected(); }));
  const std::size_t before = service_.calls().size();

  client.send(7, {{"n", 1}}, kPlayback, kStart);
  client.stop(7);
  client.send(7, {{"n", 2}}, kPlayback, kStart);
  client.destroySession(7);
  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  std::string members;
  const auto calls = service_.calls();
  for (std::size_t index = before; index < calls.size(); ++index)
    members += calls[index].member + " ";
  EXPECT_EQ(members,
            "createReportingSession startReportingSessionForID sendMessage "
            "stopReportingSessionForID sendMessage destroyReportingSession reporterIDValid ");
}

TEST_F(HalvoxClientReconnectTest, MessagesInFlightAtALossAreLostAndNotSentAgain) {
  HalvoxClient client(options());
  ASSERT_TRUE(client.flush(kPatience));
  service_.setStalled(true);
  for (int number = 0; number < 1000; ++number) {
    ASSERT_TRUE(client.send(7, {{"n", number}}, kPlayback, kStart));
  }
  EXPECT_FALSE(client.flush(50ms));  // by now the window is full

  service_.vanish();
  service_.setStalled(false);
  ASSERT_TRUE(eventually([&] { return client.counters().lost > 0; }));
  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  const Counters counters = client.counters();
  EXPECT_LE(counters.lost, 256U);
  EXPECT_EQ(counters.acknowledged, 1000U - counters.lost);
  EXPECT_EQ(counters.pending, 0U);
  const auto numbers = numbersReceived();
  ASSERT_EQ(numbers.size(), counters.acknowledged);
  EXPECT_EQ(numbers.front(), static_cast<std::int64_t>(counters.lost));
  EXPECT_TRUE(std::is_sorted(numbers.begin(), numbers.end()));
}

TEST_F(HalvoxClientReconnectTest, WhatAServiceHadNotTakenAtItsEndArrivesAtTheNextOneOnce) {
  HalvoxClient client(options());
  ASSERT_TRUE(client.flush(kPatience));
  service_.setStalled(true);
  for (int number = 0; number < 1000; ++number) {
    ASSERT_TRUE(
        client.send(7, {{"n", number}, {"text", std::string(700, 'x')}}, kPlayback, kStart));
  }
  EXPECT_FALSE(client.flush(50ms));  // by now the window is full

  service_.end();
  service_.setStalled(false);
  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  std::vector<std::int64_t> all(1000);
  std::iota(all.begin(), all.end(), 0);
  EXPECT_EQ(numbersReceived(), all);
  EXPECT_EQ(client.counters().acknowledged, 1000U);
  EXPECT_EQ(client.counters().lost, 0U);
}

TEST_F(HalvoxClientReconnectTest, MessagesThatAServiceTookBeforeItsEndAreNotSentAgain) {
  HalvoxClient client(options());
  ASSERT_TRUE(client.flush(kPatience));
  service_.setSilent(true);
  for (int number = 0; number < 3; ++number) client.send(7, {{"n", number}}, kPlayback, kStart);
  ASSERT_TRUE(service_.waitForCalls("sendMessage", 3));
  service_.setStalled(true);
  client.send(7, {{"n", 3}}, kPlayback, kStart);
  EXPECT_FALSE(client.flush(50ms));

  service_.end();
  service_.setStalled(false);
  service_.setSilent(false);
  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  EXPECT_EQ(numbersReceived(), (std::vector<std::int64_t>{0, 1, 2, 3}));
  EXPECT_EQ(client.counters().acknowledged, 4U);
  expectBalance(client.counters());
}

TEST_F(HalvoxClientReconnectTest, SessionStepsThatAServiceHadNotTakenAtItsEndKeepTheirOrder) {
  HalvoxClient client(options());
  client.createSession(7);
  client.setConfiguration(7, {{"a", 1}});
  client.start(7);
  ASSERT_TRUE(client.flush(kPatience));
  const std::size_t before = service_.calls().size();
  service_.setStalled(true);
  client.send(7, {{"n", 1}}, kPlayback, kStart);
  client.stop(7);
  client.send(7, {{"n", 2}}, kPlayback, kStart);
  client.destroySession(7);
  client.createSession(8);
  EXPECT_FALSE(client.flush(50ms));

  service_.end();
  service_.setStalled(false);
  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  std::string members;
  const auto calls = service_.calls();
  for (std::size_t index = before; index < calls.size(); ++index)
    members += calls[index].member + " ";
  EXPECT_EQ(members,
            "createReportingSession setConfiguration startReportingSessionForID sendMessage "
            "stopReportingSessionForID sendMessage destroyReportingSession createReportingSession "
            "reporterIDValid reporterIDValid ");  // of both flushes
  EXPECT_EQ(client.counters().lost, 0U);
}

TEST_F(HalvoxClientReconnectTest, NothingIsLostOrDoubledOverOrderlyEndsUnderLoad) {
  HalvoxClient client(options());
  client.createSession(7);
  client.start(7);
  std::atomic<bool> done{false};
  std::int64_t sent = 0;
  std::jthread sender([&] {
    while (!done) {
      if (client.send(7, {{"n", sent}}, kPlayback, kStart)) ++sent;
      while (!done && client.counters().pending > 300) std::this_thread::yield();
    }
  });

  for (int round = 0; round < 5; ++round) {
    const std::size_t before = service_.count("sendMessage");
    ASSERT_TRUE(service_.waitForCalls("sendMessage", before + 100));
    service_.end();
    service_.come();
  }
  done = true;
  sender.join();
  ASSERT_TRUE(client.flush(kPatience));

  std::vector<std::int64_t> all(static_cast<std::size_t>(sent));
  std::iota(all.begin(), all.end(), 0);
  EXPECT_EQ(numbersReceived(), all);
  EXPECT_EQ(client.counters().lost, 0U);
  EXPECT_EQ(client.counters().acknowledged, static_cast<std::uint64_t>(sent));
}

TEST_F(HalvoxClientReconnectTest, TellsItsHandlerOfEveryConnectionMadeAndLost) {
  HalvoxClient client(options());
  ASSERT_TRUE(client.flush(kPatience));
  std::atomic<int> made{0};
  std::atomic<int> lost{0};

  client.setConnectionHandler([&](bool connected) { ++(connected ? made : lost); });
  ASSERT_TRUE(eventually([&] { return made == 1; }));  // it was connected already
  service_.vanish();
  ASSERT_TRUE(eventually([&] { return lost == 1; }));
  service_.come();

  EXPECT_TRUE(eventually([&] { return made == 2; }));
  EXPECT_EQ(lost, 1);
  client.setConnectionHandler(nullptr);
}

TEST_F(HalvoxClientReconnectTest, DestructionDoesNotWaitForAServiceThatIsNotThere) {
  service_.vanish();
  // If destruction waited for the stalled service, it would take a second each time. A busy machine
  // may delay one destruction by as much, but hardly ten in a row.
  std::chrono::steady_clock::duration fastest = 1h;
  for (int attempt = 0; attempt < 10 && fastest >= 900ms; ++attempt) {
    const auto before = std::chrono::steady_clock::now();
    {
      HalvoxClient client(options());
      client.send(7, {{"n", 1}}, kPlayback, kStart);
    }
    fastest = std::min(fastest, std::chrono::steady_clock::now() - before);
  }

  EXPECT_LT(fastest, 900ms);
}

TEST_F(HalvoxClientReconnectTest, GivesUpWhatWaitsWhenSessionStepsPileUpWithoutAService) {
  service_.vanish();
  HalvoxClient client(options());
  client.send(1, {{"n", 1}}, kPlayback, kStart);
  for (ReporterID id = 1; id <= 9000; ++id) {
    client.createSession(id);
    if (id > 3) client.destroySession(id);
  }

  service_.come();
  ASSERT_TRUE(client.flush(kPatience));

  auto connection = HalvoxConnection::open(socketPath_);
  ASSERT_TRUE(connection);
  EXPECT_EQ((*connection.value)->getAllReporters().value, (std::vector<ReporterID>{1, 2, 3}));
  EXPECT_EQ(client.counters().lost, 1U);
  expectBalance(client.counters());
}

TEST_F(HalvoxClientReconnectTest, SurvivesAServiceThatComesAndGoesUnderLoad) {
  HalvoxClient client(options());
  std::atomic<bool> done{false};
  std::jthread sender([&] {
    for (std::int64_t number = 0; !done; ++number) {
      client.send(7, {{"n", number}}, kPlayback, kStart);
      // The ring must not be full. The test would otherwise only show that messages are refused.
      while (!done && client.counters().pending > 64) std::this_thread::yield();
    }
  });

  for (int round = 0; round < 5; ++round) {
    const std::size_t before = service_.count("sendMessage");
    ASSERT_TRUE(service_.waitForCalls("sendMessage", before + 100));
    service_.vanish();
    service_.come();
  }
  done = true;
  sender.join();
  ASSERT_TRUE(client.flush(kPatience));

  const Counters counters = client.counters();
  EXPECT_GE(counters.reconnects, 4U);
  EXPECT_EQ(counters.pending, 0U);
  expectBalance(counters);
}

}  // namespace
}  // namespace halvox::client
