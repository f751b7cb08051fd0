#include <string>
#include <vector>

#include "service/ServiceFixture.h"

// When sessions sample the drivers and when they report the counts.
namespace halvox {
namespace {

using platform::JournalKind;
using Texts = std::vector<std::string>;

class HVReportingServiceDriversTest : public ServiceFixture {
 protected:
  // The service finds channels when it starts.
  HVReportingServiceDriversTest() {
    setCycles(5);
    delegate_ = std::make_shared<HVReportingServiceDelegate>();
    platform_.connections.serviceListener().setDelegate(*delegate_);
    client_ = connect(100);
    forgetSteps();
  }
  // Sets what the only channel has counted.
  void setCycles(std::int64_t cycles) {
    platform_.ioReport.setGroup("Speaker-(null)", {{.driverName = "Amp",
                                                    .group = "Speaker",
                                                    .channelName = "cycles",
                                                    .integerValue = cycles}});
  }
  Texts operations() const { return platform_.journal.texts(JournalKind::kNote); }
  // The given steps that happened, in the order in which they happened.
  Texts order(const std::vector<std::string_view>& named) const {
    Texts found;
    for (const std::string& step : steps()) {
      if (std::ranges::find(named, step) != named.end()) found.push_back(step);
    }
    return found;
  }

  Connection client_;
};

TEST_F(HVReportingServiceDriversTest, StartTakesASnapshotAfterTheSessionHasStarted) {
  createAndStart(client_, 7);

  EXPECT_EQ(operations(), Texts{"samples Speaker-(null)"});
  EXPECT_EQ(sessionOf(client_, 7)->driverSnapShot()->size(), 1U);
  EXPECT_EQ(
      order({"starting session owned by 7", "sampling driver Speaker-(null)", "getting features"}),
      (Texts{"starting session owned by 7", "sampling driver Speaker-(null)", "getting features"}));
}

TEST_F(HVReportingServiceDriversTest, SecondStartDoesNotSampleAgain) {
  createAndStart(client_, 7);
  forgetSteps();

  start(client_, 7);

  EXPECT_TRUE(operations().empty());
}

TEST_F(HVReportingServiceDriversTest, StopReportsTheDifferenceBeforeTheSessionEnds) {
  createAndStart(client_, 7);
  setCycles(12);
  forgetSteps();

  stop(client_, 7);

  EXPECT_EQ(operations(),
            (Texts{"samples Speaker-(null)", "delta Speaker-(null)", "iterate Speaker-(null)"}));
  EXPECT_EQ(sessionOf(client_, 7)->driverSnapShot(), std::nullopt);
  const auto events = platform_.analytics.events("com.tarno.halvox.IOReporting.Simple");
  ASSERT_EQ(events.size(), 1U);
  EXPECT_EQ(events[0].payload->find("Amp_Speaker_Simple_cycles")->toInt64(), 7);
  EXPECT_EQ(order({"done getting latest samples", "ending session 7"}),
            (Texts{"done getting latest samples", "ending session 7", "ending session 7"}));
}

TEST_F(HVReportingServiceDriversTest, DestroyingAStartedSessionReportsNothing) {
  createAndStart(client_, 7);
  forgetSteps();

  destroy(client_, 7);

  EXPECT_TRUE(operations().empty());
}

TEST_F(HVReportingServiceDriversTest, EndOfTheConnectionReportsNothing) {
  createAndStart(client_, 7);
  forgetSteps();

  clientOf(client_)->handleConnectionError();
  run();

  EXPECT_TRUE(operations().empty());
}

TEST_F(HVReportingServiceDriversTest, StoppingASessionThatIsNotStartedSamplesNothing) {
  create(client_, 7);

  stop(client_, 7);

  EXPECT_TRUE(operations().empty());
}

}  // namespace
}  // namespace halvox
