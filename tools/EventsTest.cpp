#include "tools/Events.h"

#include <atomic>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <thread>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "tools/StoredEventsFixture.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoredEvent;
using platform::linux_::UniqueFd;

class EventsTest : public StoredEventsFixture {
 protected:
  EventsTest() {
    setenv("TZ", "UTC", 1);
    tzset();
  }

  void storeSome() {
    store("com.a.first", {{"n", 1}});
    store("com.b.second", {{"n", 2}});
    store("com.a.third", {{"n", 3}});
    store("com.c.fourth", {{"n", 4}});
  }
  // The field "n" of the events that are shown, in order.
  std::string shown(RecordSelection request) {
    request.database = directory();
    return shownBy({.selection = request});
  }
  std::string shownBy(const ShowEvents& request) {
    std::ostringstream out;
    EXPECT_EQ(showEvents(request, OutputForm::kText, out, -1, errors_), ExitStatus::kDone);
    std::string numbers;
    std::istringstream lines(out.str());
    for (std::string line; std::getline(lines, line);)
      numbers += line.substr(line.find(" n=") + 3, 1);
    return numbers;
  }

  std::ostringstream errors_;
  std::int64_t number_ = 0;
};

TEST_F(EventsTest, ShowsEventsNewestLast) {
  storeSome();

  EXPECT_EQ(shown({}), "1234");
}

TEST_F(EventsTest, ChoosesBySessionOfTheLinkMessage) {
  for (int number = 1; number <= 4; ++number) {
    const platform::Dictionary message{{"n", number}, {"hvreporting_timestamp", 99.5 + number}};
    store("com.tarno.halvox.Session_Playback.State", message);
    store("com.tarno.music.Session_Playback.State", message);
    // The fourth is a message that the link did not store.
    if (number < 4) storeLink(number % 2 == 1 ? 7 : 8, message);
  }
  store("com.tarno.halvox.other", {{"n", 5}});
  const auto select = [this](ShowEvents request) {
    request.selection.database = directory();
    return shownBy(request);
  };

  EXPECT_EQ(select({.sessions = {7}}), "13");
  EXPECT_EQ(select({.sessions = {8}}), "2");
  EXPECT_EQ(select({.sessions = {7, 8}}), "123");
  EXPECT_EQ(select({.sessions = {9}}), "");
  EXPECT_EQ(select({.selection = {.last = 1}, .sessions = {7}}), "3");
  EXPECT_EQ(select({.selection = {.since = 104}, .sessions = {7}}), "3");
  EXPECT_EQ(select({.types = {1}, .sessions = {7}}), "");
}

TEST_F(EventsTest, ChoosesByApplicationCategoryAndType) {
  for (const char* application : {"player", "browser"}) {
    for (const char* name : {"Session_Playback.Start", "Playback.Stop"}) {
      store(std::string("com.tarno.halvox.") + name,
            {{"HostApplicationDisplayID", application}, {"n", number_++}});
    }
  }
  const auto select = [this](ShowEvents request) {
    request.selection.database = directory();
    return shownBy(request);
  };

  EXPECT_EQ(select({.applications = {"pl*"}}), "01");
  EXPECT_EQ(select({.categories = {0x08000004}}), "02");
  EXPECT_EQ(select({.categories = {4}}), "0123");
  EXPECT_EQ(select({.types = {2}}), "13");
  EXPECT_EQ(select({.selection = {.last = 1}, .applications = {"player"}}), "1");
  EXPECT_EQ(select({.applications = {"browser"}, .types = {1}}), "2");
}

TEST_F(EventsTest, ChoosesByAPatternForNamesAndPayloads) {
  storeSome();

  EXPECT_EQ(shown({.grep = *TextPattern::compile("b\\.sec|:4")}), "24");
  EXPECT_EQ(shown({.grep = *TextPattern::compile("COM")}), "");
}

TEST_F(EventsTest, ChoosesByNameAndTime) {
  storeSome();

  EXPECT_EQ(shown({.names = {"com.a.*"}}), "13");
  EXPECT_EQ(shown({.names = {"com.a.*", "*fourth"}}), "134");
  EXPECT_EQ(shown({.since = 101}), "234");
  EXPECT_EQ(shown({.until = 102}), "12");
  EXPECT_EQ(shown({.names = {"nothing"}}), "");
}

TEST_F(EventsTest, TheLastAreCountedAfterTheChoice) {
  storeSome();

  EXPECT_EQ(shown({.last = 2}), "34");
  EXPECT_EQ(shown({.names = {"com.a.*"}, .last = 1}), "3");
  EXPECT_EQ(shown({.names = {"com.a.*", "com.b.*"}, .last = 2}), "23");
  EXPECT_EQ(shown({.names = {"com.a.*", "com.b.*"}, .last = 0}), "");
}

TEST_F(EventsTest, ShowsTheNewestFirstIfAskedFor) {
  storeSome();

  EXPECT_EQ(shown({.isReversed = true}), "4321");
  EXPECT_EQ(shown({.last = 2, .isReversed = true}), "43");
  EXPECT_EQ(shown({.names = {"com.a.*"}, .isReversed = true}), "31");
}

TEST_F(EventsTest, ShowsEachMessageOnceAndCountsMessages) {
  for (std::int64_t number = 0; number < 3; ++number) {
    store("com.tarno.halvox.Playback.Start", {{"n", number}});
    store("com.tarno.music.Playback.Start", {{"n", number}});
  }
  const auto select = [this](ShowEvents request) {
    request.selection.database = directory();
    return shownBy(request);
  };

  EXPECT_EQ(select({}), "012");
  EXPECT_EQ(select({.selection = {.last = 2}}), "12");
  EXPECT_EQ(select({.selection = {.last = 2, .isReversed = true}}), "21");
  EXPECT_EQ(select({.selection = {.last = 9}}), "012");
  EXPECT_EQ(select({.hasAllNames = true}), "001122");
  EXPECT_EQ(select({.selection = {.last = 3}, .hasAllNames = true}), "122");
  EXPECT_EQ(select({.selection = {.names = {"com.tarno.halvox.*"}}}), "012");
}

TEST_F(EventsTest, ShowsEventsAboutOwnConnectionsOnlyIfAskedFor) {
  const std::string uptime = "com.tarno.halvox.hvreportingclientuptime";
  store(uptime, {{"n", 1}, {"processName", "player"}});
  store(uptime, {{"n", 2}, {"processName", "halvoxctl"}});
  const auto select = [this](ShowEvents request) {
    request.selection.database = directory();
    return shownBy(request);
  };

  EXPECT_EQ(select({}), "1");
  EXPECT_EQ(select({.selection = {.last = 1}}), "1");
  EXPECT_EQ(select({.hasOwnEvents = true}), "12");
}

// Each run continues after the cursor that the run before printed.
TEST_F(EventsTest, ContinuesAfterACursor) {
  storeSome();
  ShowEvents request{.selection = {.last = 1, .showCursor = true}};
  request.selection.names = {"com.b.*"};
  request.selection.database = directory();
  std::ostringstream out;
  ASSERT_EQ(showEvents(request, OutputForm::kText, out, -1, errors_), ExitStatus::kDone);
  const std::string text = out.str();
  const auto line = text.find("-- cursor: ");
  ASSERT_NE(line, std::string::npos) << text;
  const auto cursor = parseCursor(text.substr(line + 11, text.find('\n', line) - line - 11));
  ASSERT_TRUE(cursor) << cursor.error().message;

  EXPECT_EQ(shown({.afterCursor = *cursor}), "34");
  EXPECT_EQ(shown({.cursor = *cursor}), "234");
  EXPECT_EQ(shown({.afterCursor = *cursor, .isReversed = true}), "1");
  EXPECT_EQ(shown({.cursor = *cursor, .isReversed = true}), "21");
  EXPECT_EQ(shown({.last = 1, .afterCursor = *cursor}), "4");
  EXPECT_EQ(errors_.str(), "");
}

TEST_F(EventsTest, ACursorOfAnotherDatabaseCountsByItsTime) {
  storeSome();

  EXPECT_EQ(shown({.afterCursor = RowCursor{"events", 1'000'000, 101}}), "34");
  EXPECT_EQ(shown({.cursor = RowCursor{"events", 1, 102}}), "34");
  EXPECT_EQ(shown({.cursor = RowCursor{"events", 1, 101}, .isReversed = true}), "21");
  EXPECT_NE(errors_.str().find("another database"), std::string::npos);
}

TEST_F(EventsTest, ACursorOfAnotherCommandIsRefused) {
  RecordSelection request{.cursor = RowCursor{"link", 1, 100}, .database = directory()};
  std::ostringstream out;

  EXPECT_EQ(showEvents({.selection = request}, OutputForm::kText, out, -1, errors_),
            ExitStatus::kBadArguments);
  EXPECT_NE(errors_.str().find("begins with \"events:\""), std::string::npos);
}

TEST_F(EventsTest, JsonHasTimeNameAndPayload) {
  store("com.a.first", {{"n", 1}, {"text", "\x1B[2J"}});
  RecordSelection request;
  request.database = scratch_.path("state/halvox.db");
  std::ostringstream out;

  EXPECT_EQ(showEvents({.selection = request}, OutputForm::kJson, out, -1, errors_),
            ExitStatus::kDone);

  EXPECT_EQ(out.str().substr(0, 44), "{\"time\":100.0,\"name\":\"com.a.first\",\"payload\"");
  EXPECT_EQ(out.str().find('\x1B'), std::string::npos);
}

TEST_F(EventsTest, AMissingStoreIsReportedAsNoService) {
  RecordSelection request;
  request.database = scratch_.path("elsewhere/halvox.db");
  std::ostringstream out;

  EXPECT_EQ(showEvents({.selection = request}, OutputForm::kText, out, -1, errors_),
            ExitStatus::kNoService);
  EXPECT_NE(errors_.str().find("elsewhere"), std::string::npos);
}

TEST_F(EventsTest, AnyOtherFileIsABadArgument) {
  RecordSelection request;
  request.database = scratch_.path("state/other.db");
  std::ostringstream out;

  EXPECT_EQ(showEvents({.selection = request}, OutputForm::kText, out, -1, errors_),
            ExitStatus::kBadArguments);
}

TEST_F(EventsTest, ABadConfigurationHasItsOwnStatus) {
  const std::string configuration = scratch_.path("halvox.toml");
  std::ofstream(configuration) << "[storage]\ndirectory = 5\n";
  setenv("HALVOX_CONFIG", configuration.c_str(), 1);
  std::ostringstream out;

  EXPECT_EQ(showEvents({}, OutputForm::kText, out, -1, errors_), ExitStatus::kBadConfiguration);

  unsetenv("HALVOX_CONFIG");
}

TEST_F(EventsTest, TheConfigurationNamesTheStore) {
  store("com.a.first", {{"n", 1}});
  const std::string configuration = scratch_.path("halvox.toml");
  std::ofstream(configuration) << "[storage]\ndirectory = \"" << directory() << "\"\n";
  setenv("HALVOX_CONFIG", configuration.c_str(), 1);
  std::ostringstream out;

  EXPECT_EQ(showEvents({}, OutputForm::kText, out, -1, errors_), ExitStatus::kDone);
  EXPECT_NE(out.str().find("com.a.first"), std::string::npos);

  unsetenv("HALVOX_CONFIG");
}

// The command writes into a pipe, as for another program, and the test reads its lines.
TEST_F(EventsTest, FollowingShowsNewEventsUntilTheOutputIsClosed) {
  store("com.a.first", {{"n", 1}});
  const std::string pipePath = scratch_.path("pipe");
  ASSERT_EQ(mkfifo(pipePath.c_str(), 0600), 0);
  UniqueFd readEnd(open(pipePath.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  UniqueFd writeEnd(open(pipePath.c_str(), O_WRONLY | O_CLOEXEC));
  std::atomic<int> status{-1};
  std::jthread follower([&] {
    std::ofstream out(pipePath);
    RecordSelection request;
    request.follow = true;
    request.database = directory();
    status = static_cast<int>(
        showEvents({.selection = request}, OutputForm::kText, out, writeEnd.get(), errors_));
  });

  std::string seen;
  const auto hasSeen = [&](const char* text) {
    char buffer[4096];
    const ssize_t size = read(readEnd.get(), buffer, sizeof buffer);
    if (size > 0) seen.append(buffer, static_cast<std::size_t>(size));
    return seen.find(text) != std::string::npos;
  };
  EXPECT_TRUE(client::eventually([&] { return hasSeen("n=1"); }));
  store("com.a.second", {{"n", 2}});
  EXPECT_TRUE(client::eventually([&] { return hasSeen("n=2"); }));
  readEnd.reset();

  EXPECT_TRUE(client::eventually([&] { return status == 0; }));
}

TEST(EventCellsTest, AreTheNameAndTheFields) {
  const auto cells = eventCells({1, 86'400.25, "com.tarno.test", R"({"a":1,"b":"x y"})"});

  ASSERT_EQ(cells.size(), 2U);
  EXPECT_EQ(cells[0].text, "com.tarno.test");
  EXPECT_EQ(cells[1].text, "a=1 b=\"x y\"");
}

TEST(EventCellsTest, NothingThatAClientSentDrivesTheTerminal) {
  const StoredEvent event{1, 0, "evil\x1B[2J\xC2\x9B", "{\"k\":\"\xC2\x9B\x7F\"}"};
  const auto cells = eventCells(event);

  for (const std::string& text : {cells[0].text, cells[1].text, eventJson(event)}) {
    EXPECT_EQ(text.find_first_of("\x1B\x7F\n"), std::string::npos);
    EXPECT_EQ(text.find("\xC2\x9B"), std::string::npos);
  }
}

}  // namespace
}  // namespace halvox::tools
