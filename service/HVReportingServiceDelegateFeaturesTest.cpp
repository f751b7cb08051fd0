#include <utility>

#include "platform/preferences.h"
#include "service/ReportingQueue.h"
#include "service/ServiceFixture.h"
#include "session/HistoryFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::LogLevel;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

constexpr std::string_view kOwn = "com.tarno.halvox";
constexpr std::string_view kHomeScreen = "com.tarno.pavisk";
constexpr std::string_view kAccessory = "spatial-audio-accessory-feature";
constexpr std::string_view kAccessoryNotification =
    "com.tarno.pavisk.spatial-audio-accessory-feature.changed";

class HVReportingServiceDelegateFeaturesTest : public ServiceFixture {
 protected:
  HVReportingServiceDelegateFeaturesTest() {
    platform_.clock.setCurrentDate({1000.25});
    platform_.clock.setSystemUptime(100.5s);
  }
  ~HVReportingServiceDelegateFeaturesTest() override { platform_.dispatch.clear(); }

  // A new delegate, which reads the current settings.
  std::shared_ptr<HVReportingServiceDelegate> remake() {
    forgetSteps();
    platform_.preferences.takeReads();
    platform_.notify.clear();
    delegate_ = std::make_shared<HVReportingServiceDelegate>();
    platform_.connections.serviceListener().setDelegate(*delegate_);
    return delegate_;
  }
  void announce(std::string_view name = gReportingNotifydNotificationName) {
    platform_.notify.post(name);
    run();
  }
  // The messages in the history of a started session.
  static std::vector<Dictionary> received(const Connection& from, std::int64_t id) {
    std::vector<Dictionary> messages;
    const auto session = sessionOf(from, id);
    const auto history = session->nestedAggregatedPayloadData();
    for (RecordedMessage& entry : messagesOf(**history)) {
      messages.push_back(std::move(entry.message));
    }
    return messages;
  }
  static std::string identifier(const Connection& from, std::int64_t id) {
    const auto session = sessionOf(from, id);
    const auto history = session->nestedAggregatedPayloadData();
    return messagesOf(**history).at(0).identifier;
  }
  static Value at(const Dictionary& message, std::string_view key) {
    const Value* found = message.find(key);
    return found == nullptr ? Value() : *found;
  }
  std::size_t messagesSent() const {
    const auto all = steps();
    return static_cast<std::size_t>(std::ranges::count(all, "0x21044838"));
  }
};

// --- defaults -----------------------------------------------------------------------------------

TEST_F(HVReportingServiceDelegateFeaturesTest, WithoutPreferencesTheDefaultsDisableNothing) {
  EXPECT_EQ(delegate_->getDefaults(), (Dictionary{{"disable_reporting", 0}}));
  EXPECT_EQ(delegate_->getDefaults().find("disable_reporting")->numberKind(),
            platform::NumberKind::kInt32);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheDefaultsHoldTheDeviceNameAsAString) {
  platform_.preferences.set(kOwn, "device_name", 42);

  EXPECT_EQ(remake()->getDefaults(), (Dictionary{{"device_name", "42"}, {"disable_reporting", 0}}));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, ADeviceNameWithoutATextIsIgnored) {
  platform_.preferences.set(kOwn, "device_name", platform::Array{"a"});

  EXPECT_EQ(remake()->getDefaults(), (Dictionary{{"disable_reporting", 0}}));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, DisableReportingIsReadAsABoolean) {
  platform_.preferences.set(kOwn, "disable_reporting", "YES");

  const Dictionary defaults = remake()->getDefaults();

  EXPECT_EQ(defaults, (Dictionary{{"disable_reporting", true}}));
  EXPECT_EQ(defaults.find("disable_reporting")->numberKind(), platform::NumberKind::kBool);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, DisableReportingDisablesNothing) {
  platform_.preferences.set(kOwn, "disable_reporting", true);
  remake();
  const Connection client = connect(100);
  createAndStart(client, 7);

  EXPECT_TRUE(delegate_->isReportingEnabled());
  EXPECT_EQ(send(client, {7})->replies()[0].error, std::nullopt);
  EXPECT_EQ(historySize(client, 7), 1U);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheDefaultsAreNeverRefreshed) {
  platform_.preferences.set(kOwn, "device_name", "later");

  announce();

  EXPECT_FALSE(delegate_->getDefaults().contains("device_name"));
}

// --- registration -------------------------------------------------------------------------------

TEST_F(HVReportingServiceDelegateFeaturesTest, TheFeaturesAreDescribedInOrder) {
  EXPECT_THAT(delegate_->features(),
              ElementsAre(Dictionary{{"defaults_domain", kHomeScreen},
                                     {"feature_domain", kAccessory},
                                     {"notification", kAccessoryNotification},
                                     {"notify_token", 1}},
                          Dictionary{{"defaults_domain", kOwn},
                                     {"feature_domain", "device_name"},
                                     {"notification", "com.tarno.halvox.reporting"},
                                     {"notify_token", 2}}));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheInitialiserReadsTheDefaultsThenRegisters) {
  remake();

  using Read = platform::FakePreferenceService::Read;
  EXPECT_THAT(platform_.preferences.takeReads(),
              ElementsAre(Read{"mobile", std::string(kOwn), "device_name"},
                          Read{"mobile", std::string(kOwn), "disable_reporting"}));
  EXPECT_THAT(platform_.notify.registeredNames(),
              ElementsAre(kAccessoryNotification, gReportingNotifydNotificationName));
  EXPECT_THAT(lines(LogLevel::kInfo), ElementsAre(testing::StartsWith("listening for features ({"),
                                                  "creating ioreporting driver utility"));
  EXPECT_EQ(lines(LogLevel::kInfo)[0].find("notify_token"), std::string::npos);
  EXPECT_THAT(lines(LogLevel::kDefault),
              ElementsAre("notify setup result 0 token 1", "notify setup result 0 token 2"));
  // The drivers are set up last, after the registrations.
  EXPECT_THAT(steps()[1], "notify setup result 0 token 1");
  EXPECT_THAT(steps()[2], "notify setup result 0 token 2");
  EXPECT_THAT(steps()[3], "creating ioreporting driver utility");
  for (const auto& line : platform_.log.lines()) {
    EXPECT_EQ(line.category, line.text == steps()[3] ? "hvrd" : "hvrs");
  }
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AFailedRegistrationIsLoggedAndHasToken0) {
  platform_.notify.failRegistration(kAccessoryNotification, 1'000'000);

  remake();

  EXPECT_THAT(lines(LogLevel::kDefault),
              ElementsAre("notify setup result 1000000 token 0", "notify setup result 0 token 1"));
  EXPECT_EQ(*delegate_->features()[0].find("notify_token"), Value(0));
  EXPECT_EQ(*delegate_->features()[1].find("notify_token"), Value(1));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, ADestroyedDelegateIgnoresChanges) {
  delegate_ = nullptr;
  forgetSteps();

  announce();

  EXPECT_THAT(steps(), IsEmpty());
}

// --- state --------------------------------------------------------------------------------------

TEST_F(HVReportingServiceDelegateFeaturesTest, WithoutPreferencesThereIsNoState) {
  EXPECT_EQ(delegate_->getFeaturesState(), std::nullopt);
  EXPECT_THAT(lines(LogLevel::kDefault), ElementsAre("getting features"));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheStateHoldsTheDeviceNameAndTheTime) {
  platform_.preferences.set(kOwn, "device_name", "kitchen");

  const auto state = delegate_->getFeaturesState();

  EXPECT_EQ(state, (Dictionary{{"device_name", "kitchen"},
                               {"hvreporting_timestamp", 1000.25},
                               {"systemuptime_sec", 101}}));
  EXPECT_EQ(state->find("systemuptime_sec")->numberKind(), platform::NumberKind::kInt32);
  EXPECT_EQ(state->find("hvreporting_timestamp")->numberKind(), platform::NumberKind::kDouble);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheStateHoldsValuesAsTheyAreStored) {
  const Value nested = Dictionary{{"rooms", platform::Array{"kitchen", 2}}};
  platform_.preferences.set(kHomeScreen, kAccessory, nested);

  const auto state = delegate_->getFeaturesState();

  ASSERT_TRUE(state.has_value());
  EXPECT_EQ(at(*state, kAccessory), nested);
  EXPECT_FALSE(state->contains("device_name"));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheStateIsReadAfreshForTheUserMobile) {
  platform_.preferences.takeReads();

  EXPECT_EQ(delegate_->getFeaturesState(), std::nullopt);
  platform_.preferences.set(kOwn, "device_name", "kitchen");
  EXPECT_NE(delegate_->getFeaturesState(), std::nullopt);

  using Read = platform::FakePreferenceService::Read;
  const Read accessory{"mobile", std::string(kHomeScreen), std::string(kAccessory)};
  const Read deviceName{"mobile", std::string(kOwn), "device_name"};
  EXPECT_THAT(platform_.preferences.takeReads(),
              ElementsAre(accessory, deviceName, accessory, deviceName));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, HalvesOfTheSystemUptimeAreRoundedUp) {
  platform_.preferences.set(kOwn, "device_name", "kitchen");
  for (const auto& [uptime, rounded] : {std::pair{100.5s, 101}, {100.4999s, 100}, {101.5s, 102}}) {
    platform_.clock.setSystemUptime(uptime);
    EXPECT_EQ(at(*delegate_->getFeaturesState(), "systemuptime_sec"), Value(rounded));
  }
}

// --- session start ------------------------------------------------------------------------------

TEST_F(HVReportingServiceDelegateFeaturesTest, AStartWithoutAStateSendsNoSetupMessage) {
  const Connection client = connect(100);
  createAndStart(client, 7);

  EXPECT_EQ(historySize(client, 7), 0U);
  EXPECT_EQ(messagesSent(), 0U);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AStartSendsTheStateAsASetupMessage) {
  platform_.preferences.set(kOwn, "device_name", "kitchen");
  const Connection client = connect(100);
  createAndStart(client, 7);

  const auto messages = received(client, 7);
  ASSERT_EQ(messages.size(), 1U);
  EXPECT_EQ(at(messages[0], "device_name"), Value("kitchen"));
  EXPECT_EQ(at(messages[0], "hvreporting_timestamp"), Value(1000.25));
  EXPECT_EQ(at(messages[0], "systemuptime_sec"), Value(101));
  EXPECT_EQ(identifier(client, 7), "Setup_Setup_1");
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AStartReadsTheStateBeforeATracingTestIsAnswered) {
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
  platform_.performanceTraces.hang();  // its later callbacks do not matter here
  platform_.preferences.set(kOwn, "device_name", "kitchen");
  const Connection client = connect(100);
  create(client, 7);
  setServiceType(client, AudioServiceType::kTest, 7);
  forgetSteps();

  start(client, 7);

  EXPECT_THAT(steps(),
              ElementsAre("starting session for reporter 7", "0x21044818",
                          "starting session owned by 7", "0x2104482C", "trace configuration",
                          "trace session", "trace delegate", "trace start", "getting features",
                          "sending message for session owned by 7", "0x21044838",
                          "startReportingSessionForID", testing::StartsWith("sessions for client"),
                          testing::StartsWith("1 active reporting session(s)")));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AStartThatChangesNothingReadsNoState) {
  const Connection client = connect(100);
  createAndStart(client, 7);
  platform_.preferences.takeReads();

  start(client, 7);
  start(client, 99);

  EXPECT_THAT(platform_.preferences.takeReads(), IsEmpty());
}

// --- changes ------------------------------------------------------------------------------------

TEST_F(HVReportingServiceDelegateFeaturesTest, AChangeIsLoggedWithTokenAndState) {
  announce();

  EXPECT_THAT(steps(), ElementsAre("feature 2 changes", "getting features", "defaults (null)"));
  EXPECT_THAT(lines(LogLevel::kInfo), ElementsAre("feature 2 changes", "defaults (null)"));
  announce(kAccessoryNotification);
  EXPECT_EQ(steps()[3], "feature 1 changes");
}

TEST_F(HVReportingServiceDelegateFeaturesTest, TheChangeHandlerRunsOnTheReportingQueue) {
  platform_.notify.post(gReportingNotifydNotificationName);

  EXPECT_THAT(steps(), IsEmpty());
  EXPECT_EQ(platform_.dispatch.weights(gReportingQueueName).size(), 1U);
  run();
  EXPECT_EQ(steps().size(), 3U);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AChangeReachesTheSessionsOfAllClients) {
  const Connection first = connect(100);
  const Connection second = connect(101);
  createAndStart(first, 7);
  createAndStart(first, 8);
  createAndStart(second, 9);
  platform_.preferences.set(kOwn, "device_name", "kitchen");

  announce();

  for (const auto& [client, id] : {std::pair{first, 7}, {first, 8}, {second, 9}}) {
    ASSERT_EQ(historySize(client, id), 1U);
    EXPECT_EQ(at(received(client, id)[0], "device_name"), Value("kitchen"));
    EXPECT_EQ(identifier(client, id), "Setup_Setup_1");
  }
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AChangeReachesSessionsThatAreNotStarted) {
  const Connection client = connect(100);
  create(client, 7);
  platform_.preferences.set(kOwn, "device_name", "kitchen");
  forgetSteps();

  announce();

  EXPECT_THAT(lines(LogLevel::kDebug), testing::Contains("sending message for session owned by 7"));
  EXPECT_EQ(messagesSent(), 1U);
}

TEST_F(HVReportingServiceDelegateFeaturesTest, AChangeToNoStateSendsANullMessageToEverySession) {
  platform_.preferences.set(kOwn, "device_name", "kitchen");
  const Connection client = connect(100);
  createAndStart(client, 7);
  create(client, 8);
  platform_.preferences.remove(kOwn, "device_name");
  forgetSteps();

  announce();

  EXPECT_EQ(messagesSent(), 2U);
  const auto messages = received(client, 7);
  ASSERT_EQ(messages.size(), 2U);
  EXPECT_FALSE(messages[1].contains("device_name"));
  EXPECT_FALSE(messages[1].contains("hvreporting_timestamp"));
}

TEST_F(HVReportingServiceDelegateFeaturesTest, WithoutPreferencesAChangeSendsANullMessage) {
  const Connection client = connect(100);
  createAndStart(client, 7);
  EXPECT_EQ(historySize(client, 7), 0U);

  announce();

  EXPECT_EQ(historySize(client, 7), 1U);
  EXPECT_FALSE(received(client, 7)[0].contains("hvreporting_timestamp"));
}

}  // namespace
}  // namespace halvox
