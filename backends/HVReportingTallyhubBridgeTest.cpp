#include "backends/HVReportingTallyhubBridge.h"

#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"
#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::FakeAnalyticsService;
using platform::JournalEntry;
using platform::JournalKind;
using platform::Message;

constexpr auto kSessionPlayback = AudioEventCategory::kSession | AudioEventCategory::kPlayback;
constexpr const char* kNameOfAll = "com.tarno.halvox.Session_Playback.Start";
constexpr const char* kNameOfService = "com.tarno.haptics.Session_Playback.Start";

class HVReportingTallyhubBridgeTest : public testing::Test {
 protected:
  HVReportingTallyhubBridgeTest() { session_->setServiceType(AudioServiceType::kHaptics); }

  void handle(const Message& message) {
    HVReportingTallyhubBridge::handleEvent(message, kSessionPlayback, AudioEventType::kStart,
                                           session_);
  }
  std::vector<std::string> namesFor(AudioEventCategory category, AudioEventType type) {
    platform_.analytics.clear();
    HVReportingTallyhubBridge::handleEvent(Dictionary{}, category, type, session_);
    return platform_.analytics.sentNames();
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

// --- Names --------------------------------------------------------------------------------------

TEST_F(HVReportingTallyhubBridgeTest, BothNamesAreTestedAndSentInOrder) {
  handle(Dictionary{{"a", 1}});

  EXPECT_EQ(platform_.journal.entries({JournalKind::kAnalyticsTest, JournalKind::kAnalyticsEvent}),
            (std::vector<JournalEntry>{{JournalKind::kAnalyticsTest, kNameOfAll},
                                       {JournalKind::kAnalyticsEvent, kNameOfAll},
                                       {JournalKind::kAnalyticsTest, kNameOfService},
                                       {JournalKind::kAnalyticsEvent, kNameOfService}}));
}

TEST_F(HVReportingTallyhubBridgeTest, UnknownCategoriesAndTypesAreSentWithTheirSubstitutes) {
  EXPECT_EQ(namesFor(AudioEventCategory{0}, AudioEventType{0}),
            (std::vector<std::string>{"com.tarno.halvox.Undefined.Generic",
                                      "com.tarno.haptics.Undefined.Generic"}));
  EXPECT_EQ(namesFor(AudioEventCategory{0x00030063}, AudioEventType::kUnknown),
            (std::vector<std::string>{"com.tarno.halvox._Undefined.Unknown",
                                      "com.tarno.haptics._Undefined.Unknown"}));
}

TEST_F(HVReportingTallyhubBridgeTest, TheSecondNameIsThatOfTheSessionsService) {
  for (const auto service : {AudioServiceType::kGeneric, AudioServiceType::kSystemSounds,
                             AudioServiceType::kUnknown, AudioServiceType{14}}) {
    session_->setServiceType(service);
    const std::string name(HVReportingUtilityGenerateServiceNameFromServiceType(service));

    EXPECT_EQ(namesFor(kSessionPlayback, AudioEventType::kStart).back(),
              "com.tarno." + name + ".Session_Playback.Start");
  }
}

TEST_F(HVReportingTallyhubBridgeTest, NamesAreThoseOfTheUtilitiesForEveryCategoryAndType) {
  session_->setServiceType(AudioServiceType::kNonLongFormAudio);
  for (const std::uint32_t domain :
       {0U, 0x04000000U, 0x08000000U, 0x10000000U, 0x20000000U, 0x40000000U, 0x80000000U}) {
    for (std::uint32_t low = 0; low <= 16; ++low) {
      for (std::uint16_t type = 0; type <= 19; ++type) {
        const auto category = static_cast<AudioEventCategory>(domain | low);
        const std::string tail = HVReportingUtilityCategoryString(category) + "." +
                                 std::string(HVReportingUtilityTypeString(AudioEventType{type}));
        ASSERT_EQ(namesFor(category, AudioEventType{type}),
                  (std::vector<std::string>{"com.tarno.halvox." + tail,
                                            "com.tarno.nonlongformaudio." + tail}));
      }
    }
  }
}

TEST_F(HVReportingTallyhubBridgeTest, OnlyTheNameThatIsUsedIsSent) {
  platform_.analytics.wantOnly({kNameOfService});

  handle(Dictionary{{"a", 1}});

  EXPECT_EQ(platform_.analytics.sentNames(), std::vector<std::string>{kNameOfService});
  EXPECT_EQ(platform_.analytics.testedNames(),
            (std::vector<std::string>{kNameOfAll, kNameOfService}));
}

TEST_F(HVReportingTallyhubBridgeTest, NothingIsSentWhenNoNameIsUsed) {
  platform_.analytics.wantOnly({});

  handle(Dictionary{{"a", 1}});

  EXPECT_TRUE(platform_.analytics.events().empty());
}

// --- Payloads -----------------------------------------------------------------------------------

TEST_F(HVReportingTallyhubBridgeTest, BothPayloadsAreTheMessageWithTheApplicationsName) {
  session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
  const Dictionary expected{
      {"a b", 1}, {"audiotag", "x"}, {"HostApplicationDisplayID", "com.example.player"}};

  handle(Dictionary{{"a b", 1}, {"audiotag", "x"}});

  const std::vector<FakeAnalyticsService::Event> events = platform_.analytics.events();
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(events[0].payload, expected);
  EXPECT_EQ(events[1].payload, expected);
}

TEST_F(HVReportingTallyhubBridgeTest, TheMessagesOwnApplicationNameIsReplaced) {
  handle(Dictionary{{"HostApplicationDisplayID", "A"}});

  EXPECT_EQ(platform_.analytics.events().front().payload,
            (Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(HVReportingTallyhubBridgeTest, NoMessageGivesAPayloadOfTheApplicationsNameAlone) {
  handle(std::nullopt);

  EXPECT_EQ(platform_.analytics.events().front().payload,
            (Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(HVReportingTallyhubBridgeTest, TheMessageIsNeverModified) {
  const Dictionary original{{"HostApplicationDisplayID", "A"}, {"a", 1}};
  const Message message = original;

  handle(message);

  EXPECT_TRUE(message->isIdenticalTo(original));
  EXPECT_EQ(original, (Dictionary{{"HostApplicationDisplayID", "A"}, {"a", 1}}));
}

TEST_F(HVReportingTallyhubBridgeTest, PayloadsAreBuiltOnlyWhenTheServiceAsks) {
  platform_.analytics.setBuilding(FakeAnalyticsService::Building::kWhenTold);

  handle(Dictionary{{"a", 1}});
  EXPECT_EQ(platform_.analytics.events().front().payload, std::nullopt);

  platform_.analytics.buildPayloads();
  EXPECT_EQ(platform_.analytics.events().front().payload,
            (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(HVReportingTallyhubBridgeTest, AConfigurationChangedBeforeTheBuildIsSeen) {
  session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "before"}});
  platform_.analytics.setBuilding(FakeAnalyticsService::Building::kWhenTold);
  handle(Dictionary{});

  session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "after"}});
  platform_.analytics.buildPayloads();

  EXPECT_EQ(platform_.analytics.events().front().payload,
            (Dictionary{{"HostApplicationDisplayID", "after"}}));
}

TEST_F(HVReportingTallyhubBridgeTest, TheMessageOfALaterBuildIsThatOfTheCall) {
  platform_.analytics.setBuilding(FakeAnalyticsService::Building::kWhenTold);
  Message message = Dictionary{{"a", 1}};
  handle(message);

  message->set("a", 2);
  message.reset();
  platform_.analytics.buildPayloads();

  EXPECT_EQ(*platform_.analytics.events().front().payload->find("a"), platform::Value(1));
}

TEST_F(HVReportingTallyhubBridgeTest, EventsNotYetBuiltHoldTheSession) {
  platform_.analytics.setBuilding(FakeAnalyticsService::Building::kWhenTold);
  const std::weak_ptr<HVReportingSession> session = session_;
  handle(Dictionary{});

  session_.reset();
  EXPECT_FALSE(session.expired());

  platform_.analytics.buildPayloads();
  EXPECT_TRUE(session.expired());
  EXPECT_TRUE(platform_.analytics.events().back().payload.has_value());
}

TEST_F(HVReportingTallyhubBridgeTest, UnusedNamesHoldNothing) {
  platform_.analytics.wantOnly({});
  const std::weak_ptr<HVReportingSession> session = session_;
  handle(Dictionary{});

  session_.reset();

  EXPECT_TRUE(session.expired());
}

TEST_F(HVReportingTallyhubBridgeTest, NoBridgeObjectCanBeMade) {
  EXPECT_FALSE(std::is_default_constructible_v<HVReportingTallyhubBridge>);
}

}  // namespace
}  // namespace halvox
