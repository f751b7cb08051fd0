#include "platform/linux/store/StoreErase.h"

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/reading/EventFollower.h"
#include "platform/linux/store/spool/SqliteLinkSpool.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr double kNow = 1'700'000'000;

class StoreEraseTest : public StoreFixture {
 protected:
  // Stores what the service makes of one message: an event and a link message with its stamp.
  void message(const std::string& application, std::int64_t session, const std::string& text) {
    stamp_ += 1;
    const Dictionary payload{{"text", text}, {"hvreporting_timestamp", stamp_}};
    link(session, payload);
    Dictionary event = payload;
    event.set("HostApplicationDisplayID", application);
    service->sendAnalyticsEventLazy("com.tarno.test", [event] { return event; });
  }
  void link(std::int64_t session, const Dictionary& payload) {
    const auto party = std::make_shared<LinkParty>(LinkParty{session, "client", "service"});
    store->linkMessages().add(
        {.time = stamp_, .party = party, .category = 4, .type = 1, .payload = payload});
  }
  EraseState erase(const EraseRequest& request) {
    EXPECT_TRUE(allIsStored());
    EXPECT_TRUE(store->beginErase(request));
    EXPECT_TRUE(eventually([this] { return !store->eraseState().isRunning; }));
    return store->eraseState();
  }
  // The files of the directory of the store that have this text anywhere in their bytes.
  [[nodiscard]] std::vector<std::string> filesWith(const std::string& text) const {
    std::vector<std::string> found;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(options.directory)) {
      if (!entry.is_regular_file()) continue;
      if (readFile(entry.path()).find(text) != std::string::npos) {
        found.push_back(entry.path().filename().native());
      }
    }
    return found;
  }
  [[nodiscard]] std::vector<std::string> texts() const {
    return rows(database(),
                "SELECT payload ->> 'text' FROM analytics_events WHERE name = 'com.tarno.test'"
                " UNION ALL SELECT 'link ' || (payload ->> 'text') FROM link_messages");
  }
  [[nodiscard]] std::vector<std::string> complaints() const {
    return rows(database(), "PRAGMA integrity_check");
  }

  double stamp_ = kNow;
};

TEST_F(StoreEraseTest, APageOfUnexpectedFormFailsTheErasureAndNotTheStore) {
  start();
  message("player", 1, "one");
  message("browser", 2, "two");
  stop();
  // No query reads this table, so that SQLite itself finds nothing wrong.
  const std::string page = rows(database(), "PRAGMA page_size").at(0);
  {
    Database open;
    ASSERT_EQ(open.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
    ASSERT_EQ(open.execute("CREATE TABLE unread (n); INSERT INTO unread VALUES (1);"
                           "PRAGMA wal_checkpoint(TRUNCATE)"),
              SQLITE_OK);
  }
  const std::string root =
      rows(database(), "SELECT rootpage FROM sqlite_schema WHERE name = 'unread'").at(0);
  std::string content = readFile(database());
  content.at((std::stoul(root) - 1) * std::stoul(page) + 3) = '\x7f';  // the number of cells
  writeFile(database(), content);
  start();

  const EraseState state = erase({.application = "player"});

  EXPECT_THAT(state.problem, HasSubstr("halvoxctl verify"));
  EXPECT_THAT(texts(), ElementsAre("two", "link two"));
  message("browser", 2, "three");
  EXPECT_TRUE(allIsStored());
  EXPECT_THAT(texts(), ElementsAre("two", "three", "link two", "link three"));
}

TEST_F(StoreEraseTest, AnApplicationGoesAndOthersStay) {
  start();
  message("player", 1, "SECRET one");
  message("browser", 2, "public");
  message("player", 1, "SECRET two");

  const EraseState state = erase({.application = "player"});

  EXPECT_THAT(state.problem, IsEmpty());
  EXPECT_EQ(state.records, 4U);
  EXPECT_THAT(texts(), ElementsAre("public", "link public"));
  EXPECT_THAT(filesWith("SECRET"), IsEmpty());
  EXPECT_THAT(filesWith("player"), IsEmpty());
  EXPECT_THAT(complaints(), ElementsAre("ok"));
}

TEST_F(StoreEraseTest, LinkMessagesWithoutStampBelongToTheApplicationOfTheirSession) {
  start();
  message("player", 1, "of the player");
  link(1, {{"text", "summary of the player"}});
  message("browser", 1, "of the browser");
  link(1, {{"text", "summary of the browser"}});

  erase({.application = "player"});

  EXPECT_THAT(texts(),
              ElementsAre("of the browser", "link of the browser", "link summary of the browser"));
}

TEST_F(StoreEraseTest, ASessionGoesWithTheEventsOfItsMessages) {
  start();
  message("player", 1, "SECRET");
  message("player", 2, "public");
  link(1, {{"text", "SECRET summary"}});

  EXPECT_EQ(erase({.session = 1}).records, 3U);

  EXPECT_THAT(texts(), ElementsAre("public", "link public"));
  EXPECT_THAT(filesWith("SECRET"), IsEmpty());
}

TEST_F(StoreEraseTest, MessagesThatWaitForAServerGoToo) {
  start();
  SqliteLinkSpool spool(*store);
  const auto keep = [&](const std::string& application, int session, const std::string& text) {
    ASSERT_NE(spool.append({"halvox.media_session." + std::to_string(session), text,
                            R"({"userInfo":{"HostApplicationDisplayID":")" + application +
                                R"("},"payload":{"text":")" + text + R"("}})"}),
              0U);
  };
  keep("player", 1, "SECRET one");
  keep("browser", 2, "public");
  keep("player", 1, "SECRET two");
  keep("browser", 3, "of session three");
  ASSERT_TRUE(eventually([&] { return !spool.hasUnstored(); }));
  const auto kept = [&] {
    std::vector<std::string> found;
    LinkSpool::Number after = 0;
    for (auto read = spool.readAfter(after); read && read->through != after;
         read = spool.readAfter(after)) {
      for (const auto& [number, message] : read->messages) {
        found.push_back(std::to_string(number) + " " + message.identifier);
      }
      after = read->through;
    }
    return found;
  };

  EXPECT_EQ(erase({.application = "player"}).records, 2U);
  EXPECT_THAT(kept(), ElementsAre("2 public", "4 of session three"));
  EXPECT_EQ(erase({.session = 3}).records, 1U);
  EXPECT_THAT(kept(), ElementsAre("2 public"));

  EXPECT_THAT(filesWith("SECRET"), IsEmpty());
  EXPECT_THAT(filesWith("session three"), IsEmpty());
  EXPECT_THAT(complaints(), ElementsAre("ok"));
}

TEST_F(StoreEraseTest, WhatIsOlderThanATimeGoes) {
  start();
  sendAt(kNow - 1, 1);
  sendAt(kNow, 2);

  erase({.before = kNow});

  EXPECT_THAT(payloads(), ElementsAre(numbered(2)));
}

TEST_F(StoreEraseTest, NamesInOtherRecordsCount) {
  start();
  store->powerEvents().add(
      {.time = kNow, .eventName = "e", .payload = {{"ApplicationName", "player"}}});
  store->powerEvents().add({.time = kNow, .eventName = "e", .payload = {{"ApplicationName", "p"}}});
  const std::string text = "\x2a\x06player";
  const auto* const bytes = reinterpret_cast<const std::byte*>(text.data());
  store->issueMetrics().add({.time = kNow, .metricID = 1, .message = {bytes, bytes + text.size()}});

  EXPECT_EQ(erase({.application = "player"}).records, 2U);

  EXPECT_THAT(rows(database(), "SELECT payload FROM power_events"),
              ElementsAre(R"({"ApplicationName":"p"})"));
  EXPECT_THAT(rows(database(), "SELECT count(*) FROM issue_metrics"), ElementsAre("0"));
  EXPECT_THAT(filesWith("player"), IsEmpty());
}

TEST_F(StoreEraseTest, BytesOfRecordsThatWereDeletedBeforeGoToo) {
  options.maxMegabytes = 1;
  start();
  // Long texts of random letters, which compression leaves partly readable. Retention has deleted
  // the first of them, and their pages are in use or free.
  for (std::uint64_t number = 0; number < 300; ++number) {
    message(number % 3 == 0 ? "player" : "browser", 1,
            (number % 3 == 0 ? "SECRETSECRET" : "") + noise(number, 4000 + 37 * number));
    if (number % 5 == 0) {
      ASSERT_TRUE(allIsStored());
    }
  }
  ASSERT_TRUE(allIsStored());
  ASSERT_THAT(filesWith("SECRETSECRET"), Contains("halvox.db"));

  EXPECT_THAT(erase({.application = "player"}).problem, IsEmpty());

  EXPECT_THAT(filesWith("SECRETSECRET"), IsEmpty());
  EXPECT_THAT(complaints(), ElementsAre("ok"));
  EXPECT_THAT(rows(database(), "PRAGMA freelist_count"), ElementsAre("0"));
  message("browser", 1, "afterwards");
  stop();
  EXPECT_THAT(filesWith("SECRETSECRET"), IsEmpty());
  EXPECT_THAT(texts(), Contains("afterwards"));
}

TEST_F(StoreEraseTest, ReadersThatFollowLoseNothingElseAndSeeNothingTwice) {
  start();
  EventFollower follower;
  ASSERT_TRUE(follower.open(options.directory, {}));
  std::vector<std::string> seen;
  const auto read = [&] {
    const auto delivered = follower.deliver([&](const StoredEvent& event) {
      if (event.name == "com.tarno.test") seen.emplace_back(event.payload.substr(9, 1));
    });
    ASSERT_TRUE(delivered) << delivered.error().message;
    EXPECT_FALSE(follower.hasGap());
  };
  for (const char* text : {"a", "b", "c"}) {
    message(*text == 'b' ? "player" : "browser", 1, text);
    ASSERT_TRUE(allIsStored());
  }
  read();
  message("player", 1, "d");
  ASSERT_TRUE(allIsStored());
  erase({.application = "player"});
  message("browser", 1, "e");
  ASSERT_TRUE(allIsStored());
  read();

  EXPECT_THAT(seen, ElementsAre("a", "b", "c", "e"));
}

TEST_F(StoreEraseTest, NumbersOfErasedRecordsAreNotUsedAgain) {
  start();
  const auto add = [this](const char* application) {
    store->powerEvents().add(
        {.time = kNow, .eventName = "e", .payload = {{"ApplicationName", application}}});
    ASSERT_TRUE(allIsStored());
  };
  add("browser");
  add("player");
  erase({.application = "player"});
  start();
  add("browser");

  EXPECT_THAT(rows(database(), "SELECT count(*), max(id) > 2 FROM power_event_records"),
              ElementsAre("2|1"));
}

TEST_F(StoreEraseTest, WhatComesMeanwhileIsStored) {
  start();
  sendLong(3000);
  ASSERT_TRUE(allIsStored());
  ASSERT_TRUE(store->beginErase({.application = "player"}));
  for (std::int64_t number = 0; number < 200; ++number) send(number);
  ASSERT_TRUE(eventually([this] { return !store->eraseState().isRunning; }));
  stop();

  EXPECT_EQ(dropped(), 0U);
  EXPECT_THAT(
      rows(database(), "SELECT count(*) FROM analytics_events WHERE name = 'com.tarno.test'"),
      ElementsAre("200"));
}

TEST_F(StoreEraseTest, AReaderThatHoldsTheLogDelaysTheEnd) {
  start();
  message("player", 1, "SECRET");
  ASSERT_TRUE(allIsStored());
  Database reader;
  ASSERT_EQ(reader.open(database(), DatabaseAccess::kReadOnly), SQLITE_OK);
  ASSERT_EQ(reader.execute("BEGIN; SELECT count(*) FROM message_blocks"), SQLITE_OK);
  ASSERT_TRUE(store->beginErase({.application = "player"}));
  ASSERT_TRUE(eventually([this] { return store->eraseState().isLogHeld; }));
  EXPECT_TRUE(store->eraseState().isRunning);
  ASSERT_EQ(reader.execute("COMMIT"), SQLITE_OK);

  ASSERT_TRUE(eventually([this] { return !store->eraseState().isRunning; }));
  EXPECT_THAT(filesWith("SECRET"), IsEmpty());
}

TEST_F(StoreEraseTest, FilesOfTheSelectionGo) {
  options.root = options.directory / "root";
  start();
  message("player", 1, "SECRET");
  ASSERT_TRUE(allIsStored());
  const auto file = [this](const char* name, const std::string& text) {
    writeFile(options.directory / name, text);
  };
  file("root/logs/2026-halvox-player-haptics.json", "[]");
  file("root/logs/2026-halvox-other-haptics.json", "[]");
  file("root/logs/2026-halvox-same session-haptics.json",
       "[{\"a\": 1, \"hvreporting_timestamp\": 1700000001.0}]");
  file("root/logs/2026-halvox-named-haptics.json", "[{\"name\": \"player\"}]");
  file("snapshots/2026-x.tar.zst", "packed");
  file("halvox.db.damaged-2026", "anything");

  const EraseState state = erase({.application = "player"});

  EXPECT_EQ(state.files, 5U);
  EXPECT_TRUE(exists(options.directory / "root/logs/2026-halvox-other-haptics.json"));
}

TEST_F(StoreEraseTest, OnlyOneRunsAtATimeAndClosingEndsIt) {
  StoreErase erase({options.directory, {}});

  EXPECT_TRUE(erase.begin({.session = 1}));
  EXPECT_FALSE(erase.begin({.session = 1}));
  erase.cancel();
  EXPECT_THAT(erase.state().problem, HasSubstr("before the erasure was complete"));
  EXPECT_FALSE(erase.begin({.session = 1}));
}

TEST_F(StoreEraseTest, ErasesInAStoreWithoutAService) {
  start();
  message("player", 1, "SECRET");
  message("browser", 2, "public");
  stop();

  const auto state =
      eraseStore({options.directory, {}}, StoreSizes::of(512), {.application = "player"}, {});

  ASSERT_TRUE(state) << state.error().message;
  EXPECT_EQ(state->records, 2U);
  EXPECT_THAT(texts(), ElementsAre("public", "link public"));
  EXPECT_THAT(filesWith("SECRET"), IsEmpty());
}

TEST_F(StoreEraseTest, LeavesTheStoreOfAServiceAlone) {
  start();

  const auto state =
      eraseStore({options.directory, {}}, StoreSizes::of(512), {.application = "player"}, {});

  ASSERT_FALSE(state);
  EXPECT_EQ(state.error().code, StoreError::kInUse);
}

TEST(EraseFilesTest, NamesOfSummaryFilesAreCompared) {
  EXPECT_TRUE(isSummaryOf("2026-halvox-org.example.player-haptics.json", "org.example.player"));
  EXPECT_TRUE(isSummaryOf("2026-halvox-my-app-haptics.json", "my-app"));
  EXPECT_TRUE(isSummaryOf("2026-halvox-a_b-haptics.json", "a/b"));
  EXPECT_TRUE(isSummaryOf("2026-halvox-a_b-haptics.json",
                          "a\xC2\x80"
                          "b"));
  EXPECT_FALSE(isSummaryOf("2026-halvox-my-app-haptics.json", "my"));
  EXPECT_FALSE(isSummaryOf("2026-halvox-my-haptics.json", "my-app"));
  EXPECT_FALSE(isSummaryOf("2026-halvox.json", ""));
  EXPECT_TRUE(
      isSummaryOf("2026-halvox-" + std::string(230, 'x') + "-haptics.json", std::string(300, 'x')));
}

}  // namespace
}  // namespace halvox::platform::linux_
