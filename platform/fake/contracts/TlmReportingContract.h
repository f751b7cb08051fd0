#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/tlm_reporting.h"

namespace halvox::platform::contract {

// What every TLMReportingService promises. `Harness` has
//   TLMReportingService& service();
//   bool letRunUntil(const std::function<bool()>& condition);  // false if it never becomes true
//   static constexpr bool kFindsBackends;   // whether a discovery finds back-ends
//   static constexpr bool kTakesMessages;   // whether a message is accepted
//   std::vector<std::int64_t> arrived();    // the numbers of the messages that arrived, in order
//   void breakSending();                    // makes the service refuse messages
// and, if it needs a server, static bool isAvailable(); without the server the suite is skipped.
template <typename Harness>
class TlmReportingContract : public ::testing::Test {
 protected:
  // The answers to one discovery.
  struct Discovery {
    std::atomic<int> answers{0};
    std::atomic<bool> wasInsideTheCall{false};
    std::mutex mutex;
    std::optional<Array> backends;
  };

  void SetUp() override {
    if constexpr (requires { Harness::isAvailable(); }) {
      if (!Harness::isAvailable()) GTEST_SKIP() << "there is no server to be had";
    }
  }

  TLMReportingService& service() { return harness_.service(); }
  TLMReportingService::Session createSession(std::int64_t id) {
    return service().TLMReportingCreateSession(
        {{kTLMReportingSessionInfoSessionID, id}, {kTLMReportingSessionInfoBatchEvent, true}},
        userInfo());
  }
  static Dictionary userInfo() {
    return {{kTLMReportingUserInfoClientName, "com.tarno.test"},
            {kTLMReportingUserInfoServiceName, "contract"}};
  }
  std::shared_ptr<Discovery> discover(const TLMReportingService::Session& session) {
    auto discovery = std::make_shared<Discovery>();
    const auto isInside = std::make_shared<std::atomic<bool>>(true);
    service().TLMReportingStartConfiguration(
        session, [discovery, isInside,
                  caller = std::this_thread::get_id()](const std::optional<Array>& backends) {
          if (*isInside && std::this_thread::get_id() == caller) {
            discovery->wasInsideTheCall = true;
          }
          {
            const std::lock_guard lock(discovery->mutex);
            discovery->backends = backends;
          }
          ++discovery->answers;
        });
    *isInside = false;
    return discovery;
  }
  bool letAnswer(const Discovery& discovery) {
    return harness_.letRunUntil([&] { return discovery.answers > 0; });
  }
  // A session that has looked for back-ends, as sessions do before they send.
  TLMReportingService::Session openSession(std::int64_t id) {
    auto session = createSession(id);
    EXPECT_TRUE(letAnswer(*discover(session)));
    return session;
  }
  TLMReportingOutcome send(const TLMReportingService::Session& session, std::int64_t number) {
    const Dictionary payload{{"n", number}};
    return service().TLMReportingSendMessage(session, {4, 1, payload});
  }
  TLMReportingOutcome sendOne(std::int64_t number) {
    const Dictionary payload{{"n", number}};
    return service().TLMReportingSendOneMessage({{kTLMReportingSessionInfoSessionID, -1}},
                                                userInfo(), {4, 1, payload});
  }
  // Whether the outcome is the one that the framework promises, with a text for a failure.
  static bool isAsPromised(const TLMReportingOutcome& outcome, bool isTaken) {
    if (isTaken) return outcome.sent && !outcome.error.has_value();
    return !outcome.sent && outcome.error.has_value() && !outcome.error->description.empty();
  }
  bool letFlush(const TLMReportingService::Session& session,
                const std::shared_ptr<std::atomic<int>>& calls) {
    service().TLMReportingFlushMessages(session, [calls] { ++*calls; });
    return harness_.letRunUntil([&] { return *calls > 0; });
  }
  bool letArrive(std::size_t messages) {
    return harness_.letRunUntil([&] { return harness_.arrived().size() >= messages; });
  }

  Harness harness_;
};
TYPED_TEST_SUITE_P(TlmReportingContract);

TYPED_TEST_P(TlmReportingContract, ADiscoveryIsAnsweredLaterAndNotFromInsideTheCall) {
  const auto discovery = this->discover(this->createSession(1));

  ASSERT_TRUE(this->letAnswer(*discovery));

  EXPECT_FALSE(discovery->wasInsideTheCall);
  const std::lock_guard lock(discovery->mutex);
  EXPECT_EQ(discovery->backends.has_value(), TypeParam::kFindsBackends);
}

// This must also hold for a framework that remembers the result of the first discovery.
TYPED_TEST_P(TlmReportingContract, LaterDiscoveriesAreNotAnsweredFromInsideTheCallEither) {
  const auto session = this->openSession(1);

  for (int round = 0; round < 20; ++round) {
    const auto discovery = this->discover(round % 2 == 0 ? session : this->createSession(2));
    ASSERT_TRUE(this->letAnswer(*discovery));
    EXPECT_FALSE(discovery->wasInsideTheCall);
    const std::lock_guard lock(discovery->mutex);
    EXPECT_EQ(discovery->backends.has_value(), TypeParam::kFindsBackends);
  }
}

TYPED_TEST_P(TlmReportingContract, EachOfManyDiscoveriesIsAnsweredExactlyOnce) {
  constexpr int kDiscoveries = 100;
  std::vector<std::shared_ptr<typename TestFixture::Discovery>> discoveries;
  discoveries.reserve(kDiscoveries);
  for (int number = 0; number < kDiscoveries; ++number) {
    discoveries.push_back(this->discover(this->createSession(number)));
  }

  for (const auto& discovery : discoveries) ASSERT_TRUE(this->letAnswer(*discovery));
  this->openSession(kDiscoveries);  // leaves time for a callback that is called twice

  for (const auto& discovery : discoveries) EXPECT_EQ(discovery->answers, 1);
}

TYPED_TEST_P(TlmReportingContract, ADiscoveryIsAnsweredWhenItsSessionIsGone) {
  auto session = this->createSession(1);
  const std::weak_ptr<TLMReportingSession> watched = session;
  const auto discovery = this->discover(session);

  session.reset();

  ASSERT_TRUE(this->letAnswer(*discovery));
  EXPECT_EQ(discovery->answers, 1);
  EXPECT_TRUE(this->harness_.letRunUntil([&] { return watched.expired(); }));
}

TYPED_TEST_P(TlmReportingContract, ADiscoveryMayBeginInTheAnswerToAnother) {
  const auto second = std::make_shared<std::atomic<int>>(0);
  const auto session = this->createSession(1);

  this->service().TLMReportingStartConfiguration(session, [this, session, second](const auto&) {
    this->service().TLMReportingStartConfiguration(session, [second](const auto&) { ++*second; });
  });

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return *second == 1; }));
}

TYPED_TEST_P(TlmReportingContract, AnOutcomeTellsWhetherTheMessageWasTaken) {
  const auto session = this->openSession(1);

  EXPECT_TRUE(this->isAsPromised(this->send(session, 0), TypeParam::kTakesMessages));
  EXPECT_TRUE(this->isAsPromised(this->sendOne(1), TypeParam::kTakesMessages));
}

TYPED_TEST_P(TlmReportingContract, AMessageThatIsNotTakenHasAnErrorWithAText) {
  const auto session = this->openSession(1);

  this->harness_.breakSending();

  EXPECT_TRUE(this->isAsPromised(this->send(session, 0), false));
  EXPECT_TRUE(this->isAsPromised(this->sendOne(1), false));
}

TYPED_TEST_P(TlmReportingContract, MessagesOfASessionArriveInOrder) {
  const auto session = this->openSession(1);
  std::vector<std::int64_t> sent;
  for (std::int64_t number = 0; number < 200; ++number) {
    if (this->send(session, number).sent) sent.push_back(number);
  }

  EXPECT_EQ(sent.size(), TypeParam::kTakesMessages ? 200U : 0U);
  ASSERT_TRUE(this->letArrive(sent.size()));
  EXPECT_EQ(this->harness_.arrived(), sent);
}

TYPED_TEST_P(TlmReportingContract, AMessageOutlivesItsSession) {
  auto session = this->openSession(1);
  const bool isTaken = this->send(session, 7).sent;

  session.reset();

  ASSERT_TRUE(this->letArrive(isTaken ? 1 : 0));
}

TYPED_TEST_P(TlmReportingContract, AOneShotMessageNeedsNoSession) {
  this->openSession(1);

  const bool isTaken = this->sendOne(9).sent;

  ASSERT_TRUE(this->letArrive(isTaken ? 1 : 0));
  EXPECT_EQ(this->harness_.arrived(),
            isTaken ? std::vector<std::int64_t>{9} : std::vector<std::int64_t>{});
}

TYPED_TEST_P(TlmReportingContract, AFlushIsDoneExactlyOnceAndAfterItTheMessagesHaveArrived) {
  const auto session = this->openSession(1);
  std::size_t taken = 0;
  for (int number = 0; number < 50; ++number) taken += this->send(session, number).sent ? 1 : 0;
  const auto first = std::make_shared<std::atomic<int>>(0);
  const auto second = std::make_shared<std::atomic<int>>(0);

  ASSERT_TRUE(this->letFlush(session, first));
  EXPECT_TRUE(this->letArrive(taken));
  ASSERT_TRUE(this->letFlush(session, second));  // nothing is left to flush

  EXPECT_EQ(*first, 1);
  EXPECT_EQ(*second, 1);
}

TYPED_TEST_P(TlmReportingContract, TokensAndDescriptionsAreThere) {
  const auto first = this->service().TLMHierarchyTokenCreate();
  const auto second = this->service().TLMHierarchyTokenCreate();

  EXPECT_FALSE(first->text().empty());
  EXPECT_NE(first->text(), second->text());
  EXPECT_FALSE(this->createSession(1)->description().empty());
}

REGISTER_TYPED_TEST_SUITE_P(
    TlmReportingContract, ADiscoveryIsAnsweredLaterAndNotFromInsideTheCall,
    LaterDiscoveriesAreNotAnsweredFromInsideTheCallEither,
    EachOfManyDiscoveriesIsAnsweredExactlyOnce, ADiscoveryIsAnsweredWhenItsSessionIsGone,
    ADiscoveryMayBeginInTheAnswerToAnother, AnOutcomeTellsWhetherTheMessageWasTaken,
    AMessageThatIsNotTakenHasAnErrorWithAText, MessagesOfASessionArriveInOrder,
    AMessageOutlivesItsSession, AOneShotMessageNeedsNoSession,
    AFlushIsDoneExactlyOnceAndAfterItTheMessagesHaveArrived, TokensAndDescriptionsAreThere);

}  // namespace halvox::platform::contract
