#include "client/HalvoxClient.h"

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <sys/wait.h>
#include <unistd.h>

#include "client/HalvoxClientFixture.h"

namespace halvox::client {
namespace {

using namespace std::chrono_literals;

class HalvoxClientTest : public HalvoxClientFixture {};

TEST_F(HalvoxClientTest, CarriesOutOperationsInTheirOrder) {
  HalvoxClient client(options());

  client.createSession(7);
  client.setServiceType(7, 2);
  client.setConfiguration(7, {{"a", 1}});
  client.start(7);
  client.send(7, {{"n", 1}}, kPlayback, kStart);
  client.stop(7);
  client.destroySession(7);
  ASSERT_TRUE(client.flush(kPatience));

  EXPECT_EQ(service_.members(),
            "createReportingSession setServiceType setConfiguration startReportingSessionForID "
            "sendMessage stopReportingSessionForID destroyReportingSession reporterIDValid");
}

TEST_F(HalvoxClientTest, MessagesArriveInOrderWithAllTheyHave) {
  HalvoxClient client(options());

  for (int number = 0; number < 1000; ++number) {
    ASSERT_TRUE(client.send(7, {{"n", number}}, kPlayback, kStart));
  }
  client.send(std::vector<ReporterID>{7, 8}, {{"n", 1000}}, 0x08000004, 65535);
  client.send(std::nullopt, {{"n", 1001}}, kPlayback, kStart);
  ASSERT_TRUE(client.flush(kPatience));

  using platform::Array;
  std::vector<std::int64_t> expected(1002);
  for (std::size_t index = 0; index < expected.size(); ++index) {
    expected[index] = static_cast<std::int64_t>(index);
  }
  EXPECT_EQ(numbersReceived(), expected);
  const auto calls = service_.calls();
  EXPECT_EQ(calls[0].arguments.at(3), Value(Array{Value(Array{7})}));
  EXPECT_EQ(calls[1000].arguments, (std::vector<Value>{Dictionary{{"n", 1000}}, 0x08000004, 65535,
                                                       Array{Value(Array{7, 8})}}));
  EXPECT_EQ(calls[1001].arguments.at(3), Value(Array{}));
  EXPECT_EQ(client.counters().acknowledged, 1002U);
}

TEST_F(HalvoxClientTest, CountsRefusedMessagesAndThoseWithoutFormOnTheWire) {
  service_.refuse("sendMessage");
  HalvoxClient client(options());

  client.send(7, {{"n", 1}}, kPlayback, kStart);
  client.send(7, {{"n", Value()}}, kPlayback, kStart);
  ASSERT_TRUE(client.flush(kPatience));

  EXPECT_EQ(client.counters().refused, 2U);
  EXPECT_EQ(service_.count("sendMessage"), 1U);
  expectBalance(client.counters());
}

TEST_F(HalvoxClientTest, FlushingFromTheHandlerFailsAtOnce) {
  HalvoxClient client(options());
  std::atomic<int> outcome{-1};

  client.setConnectionHandler([&](bool) { outcome = client.flush(kPatience) ? 1 : 0; });

  ASSERT_TRUE(eventually([&] { return outcome >= 0; }));
  EXPECT_EQ(outcome, 0);
}

TEST_F(HalvoxClientTest, WaitingForEverIsNoOverflow) {
  Options patient = options();
  patient.requestTimeout = std::chrono::milliseconds::max();
  patient.reconnectMax = std::chrono::milliseconds::max();
  HalvoxClient client(patient);

  EXPECT_TRUE(client.flush(std::chrono::milliseconds::max()));
}

TEST_F(HalvoxClientTest, ManyOpenStartsDoNotCloseTheWindow) {
  HalvoxClient client(options());

  for (ReporterID id = 1; id <= 1000; ++id) {
    client.createSession(id);
    client.start(id);
  }

  EXPECT_TRUE(client.flush(kPatience));
  EXPECT_EQ(service_.count("startReportingSessionForID"), 1000U);
}

// If both sides blocked while writing, this flush would never end.
TEST_F(HalvoxClientTest, LargeMessagesInBothDirectionsDoNotDeadlock) {
  HalvoxClient client(options());
  const std::string large(60'000, 'x');
  std::uint64_t accepted = 0;

  for (int number = 0; number < 2000; ++number) {
    accepted += client.send(7, {{"n", number}, {"text", large}}, kPlayback, kStart) ? 1U : 0U;
  }

  ASSERT_TRUE(client.flush(kPatience));
  EXPECT_EQ(client.counters().acknowledged, accepted);
  EXPECT_EQ(client.counters().dropped, 2000U - accepted);
}

TEST_F(HalvoxClientTest, DestructionDeliversWhatIsPending) {
  {
    HalvoxClient client(options());
    // Destruction waits at most a second for messages. Connecting must not use up a part of that
    // second.
    ASSERT_TRUE(client.flush(kPatience));
    for (int number = 0; number < 500; ++number) {
      client.send(7, {{"n", number}}, kPlayback, kStart);
    }
  }

  EXPECT_EQ(service_.count("sendMessage"), 500U);
}

TEST_F(HalvoxClientTest, DestructionGivesAStalledServiceUpAfterASecond) {
  const auto before = std::chrono::steady_clock::now();
  {
    HalvoxClient client(options());
    ASSERT_TRUE(client.flush(kPatience));
    service_.setStalled(true);
    client.send(7, {{"n", 1}}, kPlayback, kStart);
  }

  EXPECT_LT(std::chrono::steady_clock::now() - before, 5s);
  service_.setStalled(false);
}

// The service does not read. Every send must still return at once, and the counters must account
// for every message.
TEST_F(HalvoxClientTest, SendingNeverWaitsForAStalledService) {
  constexpr int kThreads = 8;
  constexpr int kEach = 20'000;
  HalvoxClient client(options());
  ASSERT_TRUE(client.flush(kPatience));
  service_.setStalled(true);

  std::atomic<std::uint64_t> taken{0};
  const auto before = std::chrono::steady_clock::now();
  {
    std::vector<std::jthread> threads;
    threads.reserve(kThreads);
    for (int thread = 0; thread < kThreads; ++thread) {
      threads.emplace_back([&] {
        const Dictionary message{{"n", 1}};
        for (int number = 0; number < kEach; ++number) {
          if (client.send(7, message, kPlayback, kStart)) ++taken;
        }
      });
    }
  }
  const auto elapsed = std::chrono::steady_clock::now() - before;

  const Counters stalled = client.counters();
  EXPECT_LT(elapsed, 10s);  // waiting for the service would never end
  EXPECT_EQ(stalled.accepted, taken);
  EXPECT_EQ(stalled.accepted + stalled.dropped, std::uint64_t{kThreads} * kEach);
  EXPECT_EQ(stalled.pending, stalled.accepted);
  EXPECT_LE(stalled.pending, Options{}.maxPendingMessages + 256);

  service_.setStalled(false);
  ASSERT_TRUE(client.flush(kPatience));
  EXPECT_EQ(client.counters().acknowledged, taken);
  EXPECT_EQ(service_.count("sendMessage"), taken);
  expectBalance(client.counters());
}

TEST_F(HalvoxClientTest, DropsWhatExceedsTheBoundInBytes) {
  Options small = options();
  small.maxPendingBytes = 100'000;
  service_.setStalled(true);
  HalvoxClient client(small);
  const std::string large(30'000, 'x');

  for (int number = 0; number < 10; ++number) client.send(7, {{"text", large}}, kPlayback, kStart);

  EXPECT_EQ(client.counters().accepted, 3U);
  EXPECT_EQ(client.counters().dropped, 7U);
  service_.setStalled(false);
}

TEST_F(HalvoxClientTest, ManyThreadsKeepTheirOrderAndNothingIsLostOrDoubled) {
  constexpr int kThreads = 6;
  constexpr std::int64_t kEach = 1500;
  HalvoxClient client(options());
  {
    std::vector<std::jthread> threads;
    threads.reserve(kThreads);
    for (int thread = 0; thread < kThreads; ++thread) {
      threads.emplace_back([&client, thread] {
        for (std::int64_t number = 0; number < kEach;) {
          if (client.send(thread, {{"n", number}}, kPlayback, kStart)) {
            ++number;
          } else {
            std::this_thread::yield();
          }
        }
      });
    }
  }
  ASSERT_TRUE(client.flush(kPatience));

  std::vector<std::int64_t> next(kThreads, 0);
  for (const auto& call : service_.calls()) {
    if (call.member != "sendMessage") continue;
    const auto thread = call.arguments.at(3).array()[0].array()[0].toUInt64();
    EXPECT_EQ(call.arguments.at(0).dictionary().find("n")->toInt64(), next.at(thread)++);
  }
  EXPECT_EQ(next, std::vector<std::int64_t>(kThreads, kEach));
}

TEST_F(HalvoxClientTest, TakesMessagesOfMegabytesAndDropsThoseLargerThanItsBound) {
  Options large = options();
  large.maxPendingBytes = 8U << 20U;
  HalvoxClient client(large);

  EXPECT_TRUE(client.send(7, {{"n", 1}, {"text", std::string(6'000'000, 'x')}}, 4, 1));
  ASSERT_TRUE(client.flush(kPatience));
  EXPECT_FALSE(client.send(7, {{"n", 2}, {"text", std::string(9'000'000, 'x')}}, 4, 1));
  EXPECT_TRUE(client.send(7, {{"n", 3}}, 4, 1));
  ASSERT_TRUE(client.flush(kPatience));

  EXPECT_EQ(numbersReceived(), (std::vector<std::int64_t>{1, 3}));
  EXPECT_EQ(client.counters().dropped, 1U);
}

// Without a running session the worker sleeps until a message wakes it.
TEST_F(HalvoxClientTest, AMessageWakesAClientThatHasBeenQuiet) {
  HalvoxClient client(options());
  ASSERT_TRUE(client.flush(kPatience));

  client.send(7, {{"n", 1}}, kPlayback, kStart);

  EXPECT_TRUE(service_.waitForCalls("sendMessage", 1));
}

TEST_F(HalvoxClientTest, AMessageIsSentWithoutAFlushWhileASessionRuns) {
  HalvoxClient client(options());
  client.createSession(7);
  client.start(7);
  ASSERT_TRUE(client.flush(kPatience));

  for (std::size_t number = 1; number <= 5; ++number) {
    client.send(7, {{"n", 1}}, kPlayback, kStart);
    ASSERT_TRUE(service_.waitForCalls("sendMessage", number));
  }
}

TEST_F(HalvoxClientTest, FlushesOfManyThreadsAllEnd) {
  constexpr int kThreads = 4;
  constexpr int kEach = 200;
  HalvoxClient client(options());
  client.createSession(7);
  client.start(7);
  std::atomic<int> failed{0};
  {
    std::vector<std::jthread> threads;
    threads.reserve(kThreads);
    for (int thread = 0; thread < kThreads; ++thread) {
      threads.emplace_back([&] {
        for (int number = 0; number < kEach; ++number) {
          client.send(7, {{"n", number}}, kPlayback, kStart);
          if (!client.flush(kPatience)) ++failed;
        }
      });
    }
  }

  EXPECT_EQ(failed, 0);
  EXPECT_EQ(client.counters().acknowledged, std::uint64_t{kThreads} * kEach);
  EXPECT_EQ(service_.count("sendMessage"), std::size_t{kThreads} * kEach);
}

// The connection belongs to the parent process. The child must neither write to it nor wait for a
// thread that exists only in the parent.
TEST_F(HalvoxClientTest, AChildAfterForkLeavesTheParentsConnectionAlone) {
  auto client = std::make_unique<HalvoxClient>(options());
  client->createSession(7);
  client->start(7);
  ASSERT_TRUE(client->flush(kPatience));
  client->send(7, {{"n", 1}}, kPlayback, kStart);

  const pid_t child = fork();
  if (child == 0) {
    client->send(7, {{"n", 99}}, kPlayback, kStart);
    const bool flushed = client->flush(kPatience);
    client.reset();
    _exit(flushed ? 1 : 0);
  }
  int status = -1;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  client->send(7, {{"n", 2}}, kPlayback, kStart);
  ASSERT_TRUE(client->flush(kPatience));

  EXPECT_EQ(status, 0);
  EXPECT_EQ(numbersReceived(), (std::vector<std::int64_t>{1, 2}));
  EXPECT_EQ(client->counters().acknowledged, 2U);
  EXPECT_EQ(client->counters().lost, 0U);
}

TEST(DefaultSocketPathTest, FollowsTheEnvironment) {
  setenv("HALVOX_SOCKET", "/somewhere/else", 1);
  EXPECT_EQ(defaultSocketPath(), "/somewhere/else");
  unsetenv("HALVOX_SOCKET");
  setenv("XDG_RUNTIME_DIR", "/run/user/1", 1);
  EXPECT_EQ(defaultSocketPath(), "/run/user/1/halvox/reporting.sock");
  unsetenv("XDG_RUNTIME_DIR");
  EXPECT_EQ(defaultSocketPath(), "/run/halvox/reporting.sock");
}

}  // namespace
}  // namespace halvox::client
