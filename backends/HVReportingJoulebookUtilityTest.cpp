#include "backends/HVReportingJoulebookUtility.h"

#include <type_traits>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backends/BackEndCounters.h"
#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Dictionary;
using testing::ElementsAre;
using testing::IsEmpty;
using Event = platform::FakePowerLogService::Event;

class HVReportingJoulebookUtilityTest : public testing::Test {
 protected:
  HVReportingJoulebookUtilityTest() {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "A"}});
    platform_.log.clear();
  }

  void handle(const platform::Message& message, AudioEventType type = AudioEventType::kJoulebook) {
    HVReportingJoulebookUtility::handleEvent(message, AudioEventCategory::kOutput, type, session_,
                                             PowerLogCounters(platform_.statistics));
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

TEST_F(HVReportingJoulebookUtilityTest, AnEngineReportIsLoggedWithItsApplicationAndEnd) {
  handle(Dictionary{{"EngineOnTime", 4.5}, {"hvreporting_timestamp", 1000.25}, {"other", 1}});

  EXPECT_THAT(platform_.powerLog.events(),
              ElementsAre(Event{
                  28,
                  "Oxbow_Haptics",
                  {{"EngineOnDuration", 4.5}, {"ApplicationName", "A"}, {"TimestampEnd", 1000.25}},
                  std::nullopt}));
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingJoulebookUtilityTest, AnEngineReportIsShownInItsOrder) {
  handle(Dictionary{{"hvreporting_timestamp", 1000.25}, {"EngineOnTime", 4.5}});

  EXPECT_EQ(platform::describe(platform_.powerLog.events().front().payload),
            "{EngineOnDuration = 4.5; ApplicationName = A; TimestampEnd = 1000.25}");
}

TEST_F(HVReportingJoulebookUtilityTest, AnEngineReportWithoutATimeIsLoggedAsAnErrorAndWithoutIt) {
  handle(Dictionary{{"EngineOnTime", 4.5}});

  EXPECT_THAT(platform_.powerLog.events(),
              ElementsAre(Event{28,
                                "Oxbow_Haptics",
                                {{"EngineOnDuration", 4.5}, {"ApplicationName", "A"}},
                                std::nullopt}));
  ASSERT_EQ(platform_.log.lines().size(), 1U);
  const auto line = platform_.log.lines(platform::LogLevel::kError).front();
  EXPECT_EQ(line.text, "failed to get HVReporting timestamp for joulebook");
  EXPECT_EQ(line.category, "hvrp");
}

TEST_F(HVReportingJoulebookUtilityTest, AnApplicationWithoutANameIsUnknown) {
  session_ = std::make_shared<HVReportingSession>(ReporterID{8},
                                                  HVReportingSession::ProcessIdentifiers{12},
                                                  SessionCounters::make(platform_.statistics));
  platform_.log.clear();

  handle(Dictionary{{"EngineOnTime", 1}, {"hvreporting_timestamp", 2}});

  EXPECT_EQ(*platform_.powerLog.events().front().payload.find("ApplicationName"),
            platform::Value("Unknown"));
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingJoulebookUtilityTest, ALeakIsLoggedWithItsTimeAlone) {
  handle(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 30}, {"hvreporting_timestamp", 2}});

  EXPECT_THAT(platform_.powerLog.events(),
              ElementsAre(Event{28,
                                "LeakedHapticsSessionInfo",
                                {{"Haptic_Active_Hardware_Time_Seconds", 30}},
                                std::nullopt}));
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingJoulebookUtilityTest, ALeakIsLoggedWithItsClients) {
  const platform::Array clients{"a", "b"};
  handle(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 30}, {"Active_Clients", clients}});

  EXPECT_THAT(
      platform_.powerLog.events(),
      ElementsAre(Event{28,
                        "LeakedHapticsSessionInfo",
                        {{"Haptic_Active_Hardware_Time_Seconds", 30}, {"Active_Clients", clients}},
                        std::nullopt}));
}

TEST_F(HVReportingJoulebookUtilityTest, TheEngineComesBeforeTheLeak) {
  handle(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 30},
                    {"Active_Clients", 2},
                    {"EngineOnTime", 4},
                    {"hvreporting_timestamp", 5}});

  EXPECT_THAT(platform_.powerLog.events(),
              ElementsAre(testing::Field(&Event::name, "Oxbow_Haptics")));
}

// A client may send any type of value under the keys: a text stays a text, a container is shared.
TEST_F(HVReportingJoulebookUtilityTest, ValuesReachTheLogAsTheyCame) {
  const Dictionary nested{{"x", 1}};
  handle(Dictionary{{"EngineOnTime", nested}, {"hvreporting_timestamp", "late"}});

  const Dictionary payload = platform_.powerLog.events().front().payload;
  EXPECT_TRUE(payload.find("EngineOnDuration")->dictionary().isIdenticalTo(nested));
  EXPECT_EQ(*payload.find("TimestampEnd"), platform::Value("late"));
}

TEST_F(HVReportingJoulebookUtilityTest, AMessageOfNeitherKindLogsNothing) {
  handle(Dictionary{{"Active_Clients", 2}, {"hvreporting_timestamp", 5}});
  handle(Dictionary{});
  handle(std::nullopt);

  EXPECT_THAT(platform_.powerLog.events(), IsEmpty());
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingJoulebookUtilityTest, MessagesOfAnyOtherTypeLogNothing) {
  for (std::uint16_t type = 0; type < 20; ++type) {
    if (AudioEventType{type} != AudioEventType::kJoulebook) {
      handle(Dictionary{{"EngineOnTime", 4}}, AudioEventType{type});
    }
  }

  EXPECT_THAT(platform_.powerLog.events(), IsEmpty());
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingJoulebookUtilityTest, ReportsAreCountedAndTheCountsBalance) {
  handle(Dictionary{{"EngineOnTime", 4}});
  handle(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 4}});
  handle(Dictionary{});
  handle(Dictionary{}, AudioEventType::kStart);

  EXPECT_EQ(platform_.statistics.value("power log bridge", "received"), 3U);
  EXPECT_EQ(platform_.statistics.value("power log bridge", "delivered"), 2U);
  EXPECT_EQ(platform_.statistics.value("power log bridge", "dropped: no known report"), 1U);
}

TEST_F(HVReportingJoulebookUtilityTest, TheEventOfAMessageIsKnownWithoutLoggingIt) {
  const auto eventOf = HVReportingJoulebookUtility::eventOf;
  const Dictionary both{{"Haptic_Active_Hardware_Time_Seconds", 4}, {"EngineOnTime", 4}};

  EXPECT_EQ(eventOf(both, AudioEventType::kJoulebook), "Oxbow_Haptics");
  EXPECT_EQ(
      eventOf(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 4}}, AudioEventType::kJoulebook),
      "LeakedHapticsSessionInfo");
  EXPECT_EQ(eventOf(Dictionary{}, AudioEventType::kJoulebook), std::nullopt);
  EXPECT_EQ(eventOf(std::nullopt, AudioEventType::kJoulebook), std::nullopt);
  EXPECT_EQ(eventOf(both, AudioEventType::kStart), std::nullopt);
  EXPECT_THAT(platform_.powerLog.events(), IsEmpty());
}

TEST_F(HVReportingJoulebookUtilityTest, NoBridgeObjectCanBeMade) {
  EXPECT_FALSE(std::is_default_constructible_v<HVReportingJoulebookUtility>);
}

}  // namespace
}  // namespace halvox
