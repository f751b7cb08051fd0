#include "platform/linux/store/MessageBlocks.h"

#include <string>
#include <vector>

#include <malloc.h>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/reading/EventFollower.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr double kNow = 1'700'000'000;
constexpr double kDay = 86'400;
// More records than an open row can have.
constexpr std::int64_t kMany = 700;

class MessageBlocksTest : public StoreFixture {
 protected:
  MessageBlocksTest() { platform.clock.setCurrentDate({kNow}); }

  // Sends an event and waits until it is stored. The event then has a transaction of its own.
  void sendAlone(std::int64_t number) {
    send(number);
    ASSERT_TRUE(allIsStored());
  }
  void sendLink(std::int64_t session, std::int64_t number) {
    store->linkMessages().add(
        {.time = kNow,
         .party = std::make_shared<LinkParty>(LinkParty{session, "client", "music_session"}),
         .category = 3,
         .type = 9,
         .payload = {{"n", number}}});
  }
  [[nodiscard]] std::string value(const std::string& sql) const {
    const auto found = rows(database(), sql);
    return found.empty() ? "" : found.front();
  }
  // Reads events with StoreReader, as the tools do.
  std::vector<std::string> read(const RecordFilter& filter) {
    std::vector<std::string> texts;
    StoreReader reader;
    EXPECT_TRUE(reader.open(options.directory));
    EXPECT_TRUE(reader.forEachEvent(
        filter, [&](const StoredEvent& event) { texts.emplace_back(event.payload); }));
    return texts;
  }
  // Reads link messages in the same way. If there is an error, the last text is its message.
  std::vector<std::string> readLink(const RecordFilter& filter) {
    std::vector<std::string> texts;
    StoreReader reader;
    EXPECT_TRUE(reader.open(options.directory));
    const auto read = reader.forEachRecord(kLinkMessages, filter, [&](const StoredRecord& record) {
      texts.push_back(record.text(kLinkPayload));
    });
    if (!read) texts.push_back(read.error().message);
    return texts;
  }
  static std::vector<std::string> numberedTo(std::int64_t count) {
    std::vector<std::string> texts;
    for (std::int64_t number = 0; number < count; ++number) texts.push_back(numbered(number));
    return texts;
  }
  // Replaces bytes in the middle of every sealed block.
  void damageBlocks() {
    execute(database(),
            "UPDATE message_blocks SET block = substr(block, 1, 40) || x'00112233' ||"
            " substr(block, 45) WHERE length(block) > 60");
  }
};

TEST_F(MessageBlocksTest, FewRecordsAreInRowsOfTheirOwn) {
  start();
  sendAlone(0);
  sendAlone(1);
  EXPECT_EQ(value("SELECT group_concat(id || ':' || records) FROM message_blocks"), "1:1,2:1");
  EXPECT_EQ(value("SELECT count(*) FROM message_spans"), "0");
  EXPECT_THAT(payloads(), ElementsAre(numbered(0), numbered(1)));
}

TEST_F(MessageBlocksTest, RowsThatHaveGatheredBecomeOneBlockWithTheSameNumbers) {
  start();
  for (std::int64_t number = 0; number < 300; ++number) sendAlone(number);
  stop();

  EXPECT_EQ(value("SELECT id || ':' || records FROM message_blocks ORDER BY id LIMIT 1"), "1:256");
  EXPECT_EQ(value("SELECT group_concat(span) FROM message_spans"), "1");
  EXPECT_EQ(value("SELECT sum(records), max(id + records) FROM message_blocks"), "300|301");
  EXPECT_EQ(payloads(), numberedTo(300));
}

TEST_F(MessageBlocksTest, KeepsNoMemoryOfALongPayload) {
  constexpr std::size_t kMiB = std::size_t{1} << 20U;
  // With a sanitizer, this is always 0.
  const auto inUse = [] {
    const auto info = ::mallinfo2();
    return info.uordblks + info.hblkhd;
  };
  start();
  sendAlone(0);
  const std::size_t before = inUse();

  service->sendAnalyticsEventLazy("long", [] {
    return Dictionary{{"text", std::string(8 * kMiB, 'x')}};
  });
  ASSERT_TRUE(allIsStored());

  EXPECT_TRUE(eventually([&] { return inUse() < before + kMiB; }));
}

// Few long payloads fill the open rows before there are many records, and they shrink when their
// rows are joined, because they share most of their bytes.
TEST_F(MessageBlocksTest, LongPayloadsThatAreAlikeAreAllKept) {
  constexpr std::int64_t kCount = 40;
  const std::string text(100'000, 'x');
  start();
  std::vector<std::string> sent;
  for (std::int64_t number = 0; number < kCount; ++number) {
    service->sendAnalyticsEventLazy("long", [&] {
      return Dictionary{{"text", text}, {"n", number}};
    });
    ASSERT_TRUE(allIsStored());
    sent.push_back(R"({"text":")" + text + R"(","n":)" + std::to_string(number) + "}");
  }
  stop();

  EXPECT_TRUE(payloads() == sent);
  EXPECT_TRUE(read({}) == sent);
  EXPECT_EQ(value("SELECT sum(records), max(id + records) FROM message_blocks"), "40|41");
}

// A few long records fill a block in one transaction, after which the rows before it must be
// sealed.
TEST_F(MessageBlocksTest, RowsBeforeABlockOfLongPayloadsAreKept) {
  constexpr std::int64_t kCount = 40;
  start();
  for (std::int64_t number = 0; number < 3; ++number) {
    send(number);
    ASSERT_TRUE(allIsStored());
  }
  for (std::int64_t number = 3; number < kCount; ++number) {
    service->sendAnalyticsEventLazy("long", [number] {
      return Dictionary{{"number", number}, {"text", std::string(100'000, 'x')}};
    });
  }
  ASSERT_TRUE(allIsStored());

  EXPECT_EQ(payloads().size(), static_cast<std::size_t>(kCount));
  EXPECT_EQ(read({}).size(), static_cast<std::size_t>(kCount));
  stop();
  EXPECT_EQ(read({}).size(), static_cast<std::size_t>(kCount));
}

TEST_F(MessageBlocksTest, FollowerMeetsEachRecordOnceWhileRowsAreJoined) {
  start();
  EventFollower follower;
  ASSERT_TRUE(follower.open(options.directory, {}));
  std::vector<std::string> seen;
  const auto deliver = [&] {
    return follower.deliver([&](const StoredEvent& event) { seen.emplace_back(event.payload); })
        .has_value();
  };
  for (std::int64_t number = 0; number < kMany; ++number) {
    send(number);
    if (number % 7 == 0) {
      ASSERT_TRUE(allIsStored());
    }
    if (number % 5 == 0) {
      ASSERT_TRUE(deliver());
    }
  }
  EXPECT_TRUE(eventually([&] { return deliver() && seen.size() >= kMany; }));
  EXPECT_EQ(seen, numberedTo(kMany));
}

TEST_F(MessageBlocksTest, ReaderFindsTheNewestAcrossRows) {
  start();
  for (std::int64_t number = 0; number < kMany; ++number) {
    send(number);
    sendLink(7, number);
    if (number % 100 == 0) {
      ASSERT_TRUE(allIsStored());
    }
  }
  stop();
  EXPECT_THAT(read({.newest = 2}), ElementsAre(numbered(kMany - 2), numbered(kMany - 1)));
  EXPECT_THAT(read({.newest = 600}), SizeIs(600));
  EXPECT_EQ(read({.newest = 600}).front(), numbered(kMany - 600));
  EXPECT_EQ(read({.newest = 5000}), numberedTo(kMany));
  EXPECT_THAT(read({.newest = 0}), IsEmpty());
}

TEST_F(MessageBlocksTest, ReaderFindsARangeOfTimeInBlocksAndRows) {
  start();
  for (std::int64_t number = 0; number < 3000; ++number) {
    platform.clock.setCurrentDate({kNow + static_cast<double>(number)});
    send(number);
    if (number % 300 == 0 || number > 2990) {
      ASSERT_TRUE(allIsStored());
    }
  }
  stop();
  const auto some = read({.since = kNow + 500, .until = kNow + 1500});
  ASSERT_THAT(some, SizeIs(1000));
  EXPECT_EQ(some.front(), numbered(500));
  EXPECT_THAT(read({.since = kNow + 2998}), ElementsAre(numbered(2998), numbered(2999)));
  EXPECT_THAT(read({.until = kNow + 2}), ElementsAre(numbered(0), numbered(1)));
  EXPECT_THAT(read({.since = kNow + 9000}), IsEmpty());
  EXPECT_THAT(read({.until = kNow}), IsEmpty());
  EXPECT_EQ(value("SELECT count(*), min(time), max(time) FROM analytics_events WHERE time >= " +
                  std::to_string(kNow + 500) + " AND time < " + std::to_string(kNow + 1500)),
            "1000|1700000500.0|1700001499.0");
  EXPECT_EQ(value("SELECT payload FROM analytics_events WHERE time = 1700000777"), numbered(777));
}

TEST_F(MessageBlocksTest, RecordsTooOldLeaveABlockThatOthersStayIn) {
  start();
  for (std::int64_t number = 0; number < kMany; ++number) {
    platform.clock.setCurrentDate({kNow + (number % 2 == 0 ? -40 * kDay : 0)});
    send(number);
  }
  stop();
  const std::string numbers = value("SELECT max(id + records) FROM message_blocks");
  platform.clock.setCurrentDate({kNow});
  start();
  stop();
  ASSERT_THAT(payloads(), SizeIs(kMany / 2));
  EXPECT_EQ(payloads().front(), numbered(1));
  EXPECT_EQ(payloads().back(), numbered(kMany - 1));
  EXPECT_EQ(value("SELECT max(id + records) FROM message_blocks"), numbers);
}

TEST_F(MessageBlocksTest, RowsOfAnEarlierRunAreNotJoinedWithThoseOfThisOne) {
  start();
  sendAlone(0);
  sendAlone(1);
  stop();
  start();
  sendAlone(2);
  stop();
  EXPECT_EQ(value("SELECT group_concat(id || ':' || records) FROM message_blocks"), "1:2,3:1");
  EXPECT_EQ(payloads(), numberedTo(3));
}

TEST_F(MessageBlocksTest, ReaderReportsADamagedBlockAfterTheRecordsBeforeIt) {
  start();
  for (std::int64_t number = 0; number < kMany; ++number) send(number);
  stop();
  damageBlocks();

  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  const auto read = reader.forEachEvent({}, [](const StoredEvent&) {});
  ASSERT_FALSE(read);
  EXPECT_EQ(read.error().code, StoreError::kDamaged);
  EXPECT_THAT(read.error().message, HasSubstr("cannot be unpacked"));
  EXPECT_THAT(payloads().back(), HasSubstr("a block of messages is damaged"));
}

class MessageKeysTest : public MessageBlocksTest {
 protected:
  // Stores blocks of three sessions, one after the other, and damages all blocks except those of
  // the second session. A reader that unpacks a damaged block gets an error.
  void storeSessions() {
    start();
    for (std::int64_t session = 1; session <= 3; ++session) {
      for (std::int64_t number = 0; number < kMany; ++number) {
        const std::string application = "org.app" + std::to_string(session);
        const auto builder = [application, number] {
          return Dictionary{{"HostApplicationDisplayID", application}, {"n", number}};
        };
        service->sendAnalyticsEventLazy("com.tarno.event" + std::to_string(session), builder);
        sendLink(session, number);
      }
      ASSERT_TRUE(allIsStored());
      // Open rows have no keys. Opening the store again seals them.
      start();
    }
    stop();
    execute(database(),
            "UPDATE message_blocks SET block = substr(block, 1, 40) || x'00112233' ||"
            " substr(block, 45) WHERE id NOT BETWEEN 2 * 700 + 1 AND 4 * 700");
    ASSERT_THAT(readLink({}).back(), HasSubstr("cannot be unpacked"));
  }
};

TEST_F(MessageKeysTest, ReaderReadsOnlyTheBlocksOfASession) {
  storeSessions();
  const auto session = [](std::int64_t number) {
    return std::vector<NumberMatch>{{kLinkSessionID, {number}}};
  };
  EXPECT_THAT(readLink({.numbers = session(2)}), SizeIs(kMany));
  EXPECT_THAT(readLink({.newest = 2, .numbers = session(2)}),
              ElementsAre("{\"n\":698}", "{\"n\":699}"));
  EXPECT_THAT(readLink({.after = 2 * kMany + 2 * 698, .numbers = session(2)}),
              ElementsAre("{\"n\":698}", "{\"n\":699}"));
  EXPECT_THAT(readLink({.numbers = session(9)}), IsEmpty());
  EXPECT_THAT(readLink({.numbers = session(3)}).back(), HasSubstr("cannot be unpacked"));
  EXPECT_THAT(readLink({.newest = 1, .numbers = session(3)}),
              ElementsAre(HasSubstr("cannot be unpacked")));
}

TEST_F(MessageKeysTest, ReaderReadsOnlyTheBlocksWithAName) {
  storeSessions();
  EXPECT_THAT(read({.names = {"com.tarno.event2"}}), SizeIs(kMany));
  EXPECT_THAT(read({.names = {"com.tarno.event2", "other"}, .newest = 1}), SizeIs(1));
  EXPECT_THAT(read({.names = {"other"}}), IsEmpty());
}

TEST_F(MessageKeysTest, QueriesReadOnlyTheBlocksOfASessionOrAnApplication) {
  storeSessions();
  for (const std::string condition :
       {"link_messages WHERE session_id = 2", "analytics_events WHERE name = 'com.tarno.event2'",
        "halvox_events WHERE application = 'org.app2'"}) {
    EXPECT_EQ(value("SELECT count(*) FROM " + condition), "700") << condition;
  }
  EXPECT_EQ(value("SELECT count(*) FROM link_messages WHERE client_name = 'other'"), "0");
  // A condition for which there is no key reads all blocks.
  for (const std::string condition :
       {"link_messages WHERE session_id = '2.0'", "link_messages WHERE session_id > 1",
        "analytics_events WHERE name = 'COM.tarno.event2' COLLATE NOCASE"}) {
    EXPECT_THAT(value("SELECT count(*) FROM " + condition), HasSubstr("is damaged")) << condition;
  }
}

// Fills a store of the last version without blocks: one event with its twin, and one link message.
void makeVersion2(const std::filesystem::path& database) {
  execute(database,
          "INSERT INTO event_names VALUES (1, 'com.tarno.a'), (2, 'com.tarno.b');"
          "INSERT INTO analytics_records VALUES (4, 1700000000.0, 1, 1700000001.0, 2, '{\"o\":1}');"
          "INSERT INTO analytics_spans VALUES (0, 1700000000.0, 1700000001.0);"
          "INSERT INTO link_message_records VALUES"
          " (40, 1700000002.0, 7, 'client', 'music_session', 3, 9, '{\"o\":2}');"
          "INSERT INTO link_message_spans VALUES (0, 1700000002.0, 1700000002.0);"
          "DROP VIEW analytics_events; DROP VIEW link_messages;"
          "CREATE VIEW analytics_events AS SELECT 1; CREATE VIEW link_messages AS SELECT 1;"
          "DROP TABLE message_blocks; DROP TABLE message_spans; DROP VIEW losses;"
          "DROP TABLE loss_records; DROP TABLE loss_spans; DROP VIEW runs; DROP TABLE run_records;"
          "DROP TABLE link_spool;"
          "PRAGMA user_version = 2");
}

TEST_F(MessageBlocksTest, RecordsOfTheVersionBeforeComeFirst) {
  start();
  stop();
  makeVersion2(database());
  start();
  send(1);
  sendLink(7, 5);
  stop();

  EXPECT_THAT(rows(database(), "SELECT time, payload FROM analytics_events"),
              ElementsAre("1700000000.0|{\"o\":1}", "1700000001.0|{\"o\":1}",
                          "1700000000.0|{\"number\":1}"));
  EXPECT_THAT(rows(database(), "SELECT payload FROM link_messages"),
              ElementsAre("{\"o\":2}", "{\"n\":5}"));
  EXPECT_THAT(read({}), ElementsAre("{\"o\":1}", "{\"o\":1}", numbered(1)));
  EXPECT_THAT(read({.newest = 2}), ElementsAre("{\"o\":1}", numbered(1)));
  EXPECT_THAT(read({.newest = 1}), ElementsAre(numbered(1)));
  EXPECT_THAT(read({.after = 8}), ElementsAre("{\"o\":1}", numbered(1)));
  EXPECT_THAT(read({.after = 9}), ElementsAre(numbered(1)));
  EXPECT_THAT(read({.before = 9}), ElementsAre("{\"o\":1}"));
  const auto reversed = RecordOrder::kNewestFirst;
  EXPECT_THAT(read({.order = reversed}), ElementsAre(numbered(1), "{\"o\":1}", "{\"o\":1}"));
  EXPECT_THAT(read({.newest = 2, .order = reversed}), ElementsAre(numbered(1), "{\"o\":1}"));
  EXPECT_THAT(readLink({.order = reversed}), ElementsAre("{\"n\":5}", "{\"o\":2}"));
}

TEST_F(MessageBlocksTest, NumbersContinueAfterThoseOfTheVersionBefore) {
  start();
  stop();
  makeVersion2(database());
  start();
  send(1);
  stop();
  // The old events are in a span of 512 records with two events each. New numbers begin after that
  // span.
  EXPECT_EQ(value("SELECT id > 2 * 511 + 1 FROM message_blocks"), "1");
}

}  // namespace
}  // namespace halvox::platform::linux_
