#include "service/ServiceFixture.h"

// The state of the service in captures of diagnostics.

namespace halvox {
namespace {

using platform::Dictionary;

class HVReportingServiceDelegateStateTest : public ServiceFixture {
 protected:
  // Asks the service for its state; none if it does not answer.
  std::optional<Dictionary> state() {
    std::optional<Dictionary> given;
    platform_.diagnosticReporters.askState([&given](const Dictionary& state) { given = state; });
    EXPECT_FALSE(given.has_value()) << "the state was not taken on the reporting queue";
    run();
    return given;
  }
};

TEST_F(HVReportingServiceDelegateStateTest, DescribesTheClientsAndTheirSessions) {
  platform_.clock.setCurrentDate({1000});
  const Connection player = connect(12, "player");
  connect(13, "mixer");
  createAndStart(player, 7);

  const Dictionary given = state().value_or(Dictionary{});

  EXPECT_EQ(given.find("client_count")->toInt64(), 2);
  EXPECT_EQ(given.find("session_count")->toInt64(), 1);
  const platform::Array clients = given.find("clients")->array();
  ASSERT_EQ(clients.size(), 2U);
  const Dictionary first = clients[0].dictionary();
  EXPECT_EQ(first.find("pid")->toInt64(), 12);
  EXPECT_EQ(first.find("process_name")->string(), "player");
  EXPECT_EQ(first.find("start_date")->date(), platform::Date{1000});
  EXPECT_EQ(*first.find("sessions"),
            platform::Value(platform::Array{sessionOf(player, 7)->description()}));
  EXPECT_EQ(clients[1].dictionary().find("session_count")->toInt64(), 0);
}

TEST_F(HVReportingServiceDelegateStateTest, IsTheWholeOfTheseEntries) {
  platform_.clock.setCurrentDate({1000});
  const Connection player = connect(12, "player");
  createAndStart(player, 7);
  const Dictionary client{{"pid", 12},
                          {"process_name", "player"},
                          {"start_date", platform::Date{1000}},
                          {"session_count", 1},
                          {"sessions", platform::Array{sessionOf(player, 7)->description()}}};

  EXPECT_EQ(state().value_or(Dictionary{}), (Dictionary{{"reporting_enabled", true},
                                                        {"active_session_count", 1},
                                                        {"client_count", 1},
                                                        {"session_count", 1},
                                                        {"sessions_described", 1},
                                                        {"clients", platform::Array{client}}}));
}

TEST_F(HVReportingServiceDelegateStateTest, DescribesABoundedNumberOfSessionsAndCountsAll) {
  const Connection player = connect(12);
  for (std::int64_t id = 1; id <= 5003; ++id) create(player, id);

  const Dictionary given = state().value_or(Dictionary{});

  EXPECT_EQ(given.find("session_count")->toInt64(), 5003);
  EXPECT_EQ(given.find("sessions_described")->toInt64(), 5000);
}

TEST_F(HVReportingServiceDelegateStateTest, DoesNotAnswerAfterTheServiceIsDestroyed) {
  delegate_.reset();

  EXPECT_EQ(state(), std::nullopt);
}

}  // namespace
}  // namespace halvox
