#include "platform/linux/link/local/LocalTlmReportingService.h"

#include <memory>
#include <thread>
#include <vector>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;

class LocalTlmReportingServiceTest : public StoreFixture {
 protected:
  LocalTlmReportingServiceTest() { platform.clock.setCurrentDate({1'700'000'000.5}); }

  void startLink() {
    start();
    link = std::make_unique<LocalTlmReportingService>(*store, platform.clock, callbacks);
  }
  static Dictionary sessionInfo(std::int64_t sessionID) {
    return {{kTLMReportingSessionInfoSessionID, sessionID}};
  }
  static Dictionary userInfo(const Value& serviceName) {
    return {{kTLMReportingUserInfoClientName, "com.tarno.halvox"},
            {kTLMReportingUserInfoServiceName, serviceName}};
  }
  [[nodiscard]] std::vector<std::string> stored(const std::string& columns) const {
    return rows(database(), "SELECT " + columns + " FROM link_messages");
  }

  CallbackThread callbacks{platform.dispatch};
  std::unique_ptr<LocalTlmReportingService> link;
};

TEST_F(LocalTlmReportingServiceTest, FindsTheOneBackendOnce) {
  startLink();
  std::vector<std::optional<Array>> found;

  link->TLMReportingStartConfiguration(
      link->TLMReportingCreateSession(sessionInfo(7), {}),
      [&](const std::optional<Array>& backends) { found.push_back(backends); });
  callbacks.stop();  // waits for the answer

  ASSERT_EQ(found.size(), 1U);
  EXPECT_EQ(Value(found.front().value_or(Array{})), Value(Array{"local"}));
}

TEST_F(LocalTlmReportingServiceTest, MessageIsStoredUnderItsSession) {
  startLink();
  const auto session = link->TLMReportingCreateSession(sessionInfo(7), userInfo("music_session"));

  const auto outcome = link->TLMReportingSendMessage(session, {65'535, 9, {{"volume", 0.5}}});
  stop();

  EXPECT_TRUE(outcome.sent);
  EXPECT_FALSE(outcome.error.has_value());
  EXPECT_THAT(stored("*"), ElementsAre("1700000000.5|7|com.tarno.halvox|music_session|65535|9|"
                                       "{\"volume\":0.5}"));
}

TEST_F(LocalTlmReportingServiceTest, OnlyNotesMessagesUnlessTheStoreIsBehind) {
  startLink();
  EXPECT_TRUE(link->onlyNotesMessages());

  backpressure.raise();
  EXPECT_FALSE(link->onlyNotesMessages());

  backpressure.relieve();
  EXPECT_TRUE(link->onlyNotesMessages());
}

TEST_F(LocalTlmReportingServiceTest, MessageOutlivesItsSession) {
  startLink();
  auto session = link->TLMReportingCreateSession(sessionInfo(7), userInfo("s"));

  ASSERT_TRUE(link->TLMReportingSendMessage(session, {1, 2, {}}).sent);
  session.reset();
  stop();

  EXPECT_THAT(stored("session_id, service_name"), ElementsAre("7|s"));
}

TEST_F(LocalTlmReportingServiceTest, SingleMessageNeedsNoSession) {
  startLink();

  EXPECT_TRUE(link->TLMReportingSendOneMessage(sessionInfo(-1), userInfo("s"), {1, 2, {}}).sent);
  stop();

  EXPECT_THAT(stored("session_id, client_name, service_name, category, type, payload"),
              ElementsAre("-1|com.tarno.halvox|s|1|2|{}"));
}

TEST_F(LocalTlmReportingServiceTest, NameThatIsNoTextIsStoredAsItsDescription) {
  startLink();
  const auto session = link->TLMReportingCreateSession({}, userInfo(Value(12)));

  ASSERT_TRUE(link->TLMReportingSendMessage(session, {1, 2, {}}).sent);
  stop();

  EXPECT_THAT(stored("session_id, service_name"), ElementsAre("0|12"));
}

TEST_F(LocalTlmReportingServiceTest, NameThatIsTooLongIsCutBetweenCharacters) {
  startLink();
  const std::string end = "\u00E9";  // two bytes; the second is beyond the limit
  const auto session = link->TLMReportingCreateSession(
      sessionInfo(1), userInfo(std::string(254, 'a') + end + std::string(1'000'000, 'b')));

  ASSERT_TRUE(link->TLMReportingSendMessage(session, {1, 2, {}}).sent);
  stop();

  EXPECT_THAT(stored("service_name"), ElementsAre(std::string(254, 'a')));
}

TEST_F(LocalTlmReportingServiceTest, FlushIsDoneAtOnceAndLosesNothing) {
  startLink();
  const auto session = link->TLMReportingCreateSession(sessionInfo(1), userInfo("s"));
  for (int number = 0; number < 1000; ++number) {
    ASSERT_TRUE(link->TLMReportingSendMessage(session, {1, 2, {{"n", number}}}).sent);
  }
  int flushes = 0;

  link->TLMReportingFlushMessages(session, [&] { ++flushes; });

  EXPECT_EQ(flushes, 1);
  EXPECT_TRUE(eventually([&] { return stored("count(*)").front() == "1000"; }));
}

TEST_F(LocalTlmReportingServiceTest, EachSessionOfManyThreadsKeepsItsOrder) {
  startLink();
  constexpr std::int64_t kSessions = 4;
  constexpr int kMessages = 2000;
  {
    std::vector<std::jthread> threads;
    for (std::int64_t id = 0; id < kSessions; ++id) {
      threads.emplace_back([this, id] {
        const auto session = link->TLMReportingCreateSession(sessionInfo(id), userInfo("s"));
        for (int number = 0; number < kMessages; ++number) {
          static_cast<void>(link->TLMReportingSendMessage(session, {1, 2, {{"n", number}}}));
        }
      });
    }
  }
  stop();

  EXPECT_THAT(rows(database(),
                   "SELECT count(*) FROM (SELECT json_extract(payload, '$.n') AS n,"
                   " row_number() OVER (PARTITION BY session_id ORDER BY rowid) - 1 AS place"
                   " FROM halvox_links) WHERE n = place"),
              ElementsAre("8000"));
}

TEST_F(LocalTlmReportingServiceTest, MessageAfterTheEndFailsWithAnError) {
  startLink();
  store->close();

  const auto outcome = link->TLMReportingSendOneMessage({}, {}, {1, 2, {}});

  EXPECT_FALSE(outcome.sent);
  ASSERT_TRUE(outcome.error.has_value());
  EXPECT_EQ(outcome.error->description, "the store is closed");
}

TEST_F(LocalTlmReportingServiceTest, TokensDiffer) {
  startLink();
  EXPECT_NE(link->TLMHierarchyTokenCreate()->text(), link->TLMHierarchyTokenCreate()->text());
}

}  // namespace
}  // namespace halvox::platform::linux_
