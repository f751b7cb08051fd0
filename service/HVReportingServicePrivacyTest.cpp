#include <optional>

#include "service/ServiceFixture.h"
#include "session/HistoryFixture.h"

// Each way by which a value enters the service applies the privacy rules.

namespace halvox {
namespace {

using platform::Dictionary;

class HVReportingServicePrivacyTest : public ServiceFixture {
 protected:
  ~HVReportingServicePrivacyTest() override { platform_.dispatch.clear(); }

  static Dictionary recorded(const Connection& from, std::int64_t id, std::size_t position = 0) {
    const auto session = sessionOf(from, id);
    const auto history = session->nestedAggregatedPayloadData();
    return messagesOf(**history).at(position).message;
  }

  Connection client_ = connect(100);
};

TEST_F(HVReportingServicePrivacyTest, AMessageLosesTheDroppedKeysBeforeAnyBackEndGetsIt) {
  platform_.privacy.drop("user");
  createAndStart(client_, 7);
  forgetSteps();

  send(client_, {7}, {{"user", "Ada"}, {"a", 1}});

  EXPECT_FALSE(recorded(client_, 7).contains("user"));
  EXPECT_EQ(recorded(client_, 7).find("a")->toInt64(), 1);
  EXPECT_TRUE(recorded(client_, 7).contains("hvreporting_timestamp"));
  const auto events = platform_.analytics.events("com.tarno.halvox.Playback.Start");
  ASSERT_FALSE(events.empty());
  EXPECT_FALSE(events[0].payload->contains("user"));
  EXPECT_EQ(events[0].payload->find("a")->toInt64(), 1);
}

TEST_F(HVReportingServicePrivacyTest, MessagesThatDifferOnlyInDroppedKeysAreRepetitions) {
  platform_.privacy.drop("user");
  createAndStart(client_, 7);

  send(client_, {7}, {{"user", "Ada"}, {"a", 1}});
  send(client_, {7}, {{"user", "Bob"}, {"a", 1}});

  EXPECT_EQ(historySize(client_, 7), 1U);
}

TEST_F(HVReportingServicePrivacyTest, TheStampsAreKeptWhateverIsDropped) {
  platform_.privacy.drop("hvreporting_timestamp");
  createAndStart(client_, 7);

  send(client_, {7}, {{"hvreporting_timestamp", "forged"}, {"a", 1}});

  EXPECT_TRUE(recorded(client_, 7).find("hvreporting_timestamp")->isNumber());
}

TEST_F(HVReportingServicePrivacyTest, AConfigurationLosesTheDroppedKeys) {
  platform_.privacy.drop("user");
  create(client_, 7);

  call(client_, "setConfiguration", {Dictionary{{"user", "Ada"}, {"a", 1}}, std::int64_t{7}});

  const Dictionary configuration = sessionOf(client_, 7)->configuration();
  EXPECT_FALSE(configuration.contains("user"));
  EXPECT_EQ(configuration.find("a")->toInt64(), 1);
}

TEST_F(HVReportingServicePrivacyTest, AClientsUptimeIsReportedWithoutADroppedName) {
  platform_.privacy.drop("processName");

  client_->invalidate();
  run();

  const auto events = platform_.analytics.events("com.tarno.halvox.hvreportingclientuptime");
  ASSERT_EQ(events.size(), 1U);
  EXPECT_FALSE(events[0].payload->contains("processName"));
  EXPECT_TRUE(events[0].payload->contains("seconds"));
}

TEST_F(HVReportingServicePrivacyTest, DroppedSettingsAreNeitherStateNorDefaults) {
  platform_.privacy.drop("device_name");
  platform_.preferences.set("com.tarno.halvox", "device_name", "Ada's phone");
  const auto delegate = std::make_shared<HVReportingServiceDelegate>();

  EXPECT_EQ(delegate->getFeaturesState(), std::nullopt);
  EXPECT_FALSE(delegate->getDefaults().contains("device_name"));
}

TEST_F(HVReportingServicePrivacyTest, ACaptureDescribesClientsWithoutDroppedKeys) {
  platform_.privacy.drop("process_name");
  std::optional<Dictionary> given;

  platform_.diagnosticReporters.askState([&given](const Dictionary& state) { given = state; });
  run();

  ASSERT_TRUE(given.has_value());
  const Dictionary client = given->find("clients")->array()[0].dictionary();
  EXPECT_FALSE(client.contains("process_name"));
  EXPECT_EQ(client.find("pid")->toInt64(), 100);
}

}  // namespace
}  // namespace halvox
