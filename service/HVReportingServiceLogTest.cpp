#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using testing::ElementsAre;
using testing::StartsWith;

// Which lines each request logs, with category and level. People and programs filter by them.
class HVReportingServiceLogTest : public ServiceFixture {
 protected:
  HVReportingServiceLogTest() { platform_.log.clear(); }
  ~HVReportingServiceLogTest() override { platform_.dispatch.clear(); }

  // Each line as "debug hvrs: creating session for reporter 7". Excludes the lines of links.
  std::vector<std::string> logged() {
    std::vector<std::string> texts;
    for (const auto& line : platform_.log.lines()) {
      if (isOfALink(line.text)) continue;
      texts.push_back(std::string(levelName(line.level)) + " " + line.category + ": " + line.text);
    }
    platform_.log.clear();
    return texts;
  }
  static std::string seven(int started) {
    return "(reporterID=7,serviceName=unknown,ownerPid=100,HostApplicationDisplayID=Unknown,"
           "started=" +
           std::to_string(started) + ")";
  }

  Connection client_ = connect(100);
};

TEST_F(HVReportingServiceLogTest, NewClient) {
  connect(101);

  EXPECT_THAT(logged(), ElementsAre(StartsWith("default hvrs: newConnection: "),
                                    "default hvrs: new client with pid 101"));
}

TEST_F(HVReportingServiceLogTest, Create) {
  create(client_, 7);

  EXPECT_THAT(logged(), ElementsAre("debug hvrs: creating session for reporter 7",
                                    "info hvrr: created reporting session for ID: 7",
                                    "default hvrs: session created for reporter 7"));
}

TEST_F(HVReportingServiceLogTest, ServiceTypeIsSetAndAskedFor) {
  create(client_, 7);
  platform_.log.clear();

  setServiceType(client_, AudioServiceType::kHaptics, 7);
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: setting service type 3 for reporter 7",
                                    "info hvrr: setting service type haptics",
                                    "default hvrs: service type 3 set for reporter  7"));

  call(client_, "getServiceNameForReporterID", {7});
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: fetching seviceType",
                                    "default hvrs: returning service type 3 for reporter  7"));
}

TEST_F(HVReportingServiceLogTest, ServiceTypeOfNoSession) {
  setServiceType(client_, AudioServiceType::kHaptics, 7);
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: setting service type 3 for reporter 7"));

  call(client_, "getServiceNameForReporterID", {7});
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: fetching seviceType",
                                    "error hvrs: failed to find reporting session 7",
                                    "default hvrs: returning service type 65535 for reporter  7"));
}

TEST_F(HVReportingServiceLogTest, ConfigurationAndQueries) {
  create(client_, 7);
  platform_.log.clear();

  call(client_, "setConfiguration", {platform::Dictionary{{"a", 1}}, 7});
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: setting configuration"));

  call(client_, "reporterIDValid", {7});
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: validating reporter 7",
                                    "default hvrs: validating reporter 7"));

  call(client_, "getAllReporters", {});
  EXPECT_THAT(logged(), testing::IsEmpty());
}

TEST_F(HVReportingServiceLogTest, StartAndStop) {
  create(client_, 7);
  platform_.log.clear();

  start(client_, 7);
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: starting session for reporter 7",
                                    "debug hvrr: starting session owned by 7",
                                    "default hvrs: getting features",
                                    "default hvrs: sessions for client 100 : " + seven(1),
                                    "default hvrs: 1 active reporting session(s) " + seven(1)));

  stop(client_, 7);
  EXPECT_THAT(logged(), ElementsAre("debug hvrs: stopping session for reporter 7",
                                    "debug hvrr: ending session 7", "debug hvrr: ending session 7",
                                    "default hvrs: sessions for client 100 : " + seven(0),
                                    "default hvrs: 0 active reporting session(s) ()",
                                    "default hvrs: stopping 7"));
}

TEST_F(HVReportingServiceLogTest, Destroy) {
  create(client_, 7);
  platform_.log.clear();

  destroy(client_, 7);

  EXPECT_THAT(logged(),
              ElementsAre("debug hvrs: destroying session for reporter 7",
                          "info hvrr: deallocing this session 7", "default hvrs: destroying 7"));
}

TEST_F(HVReportingServiceLogTest, MessageForOneSession) {
  create(client_, 7);
  const Connection other = connect(101);
  platform_.log.clear();

  send(other, {7});

  EXPECT_THAT(logged(),
              ElementsAre("debug hvrs: sending message for reporter (7)",
                          "info hvrs: found reporting session 7 for client 100",
                          "debug hvrr: sending message for session owned by 7",
                          "debug hvrr: session not started, will send as a single message",
                          "debug hvrr: sending single message after delta 0 for service 65535"));
}

TEST_F(HVReportingServiceLogTest, MessageWithoutActiveSessions) {
  sendToAll(client_);
  platform_.analytics.buildPayloads();  // until then the builders hold the session

  EXPECT_THAT(logged(),
              ElementsAre("debug hvrs: sending message for reporter (null)",
                          "default hvrs: sessions for client 100 : ()",
                          "default hvrs: active reporting sessions 0 : ()",
                          "info hvrr: created reporting session for ID: 1",
                          "info hvrr: setting service type standalone",
                          "default hvrs: no active reporting sessions found, sending as standalone",
                          "debug hvrr: sending single message after delta 0 for service 5",
                          "info hvrr: deallocing this session 1"));
}

TEST_F(HVReportingServiceLogTest, ChangedFeature) {
  platform_.preferences.set("com.tarno.halvox", "device_name", "Kitchen");
  platform_.notify.post("com.tarno.halvox.reporting");
  run();

  EXPECT_THAT(logged(),
              ElementsAre(StartsWith("info hvrs: feature "), "default hvrs: getting features",
                          StartsWith("info hvrs: defaults {device_name = Kitchen; ")));
}

TEST_F(HVReportingServiceLogTest, EndOfAConnection) {
  client_->interrupt();
  run();
  EXPECT_THAT(logged(), ElementsAre("default hvrs: interruptionHandler: connection exited",
                                    "default hvrs: removing 100 from the server client list"));

  client_->invalidate();
  run();
  client_.reset();
  EXPECT_THAT(logged(),
              ElementsAre("default hvrs: invalidationHandler: connection exited process=player "
                          "uptime_sec=0",
                          "default hvrs: dealloc 100 from the server client list"));
}

TEST_F(HVReportingServiceLogTest, ConnectionThatEndsBeforeItsClientIsRegistered) {
  const Connection early = connectUnregistered(102);
  platform_.log.clear();

  early->invalidate();

  EXPECT_THAT(logged(),
              ElementsAre("default hvrs: clientStartDate is nil. clientpid=102 "
                          "clientprocessname=unknown",
                          "default hvrs: invalidationHandler: connection exited process=unknown "
                          "uptime_sec=-1",
                          "default hvrs: clientProcessName is nil. clientpid=102"));
}

TEST_F(HVReportingServiceLogTest, ClientThatStartedInTheFuture) {
  const double now = platform_.clock.currentDate().secondsSince1970;
  platform_.clock.setCurrentDate({now - 42.5});

  client_->invalidate();

  EXPECT_THAT(logged(),
              ElementsAre("default hvrs: clientStartDate is in the past. clientpid=100 "
                          "clientprocessname=player",
                          "default hvrs: invalidationHandler: connection exited process=player "
                          "uptime_sec=42"));
}

TEST_F(HVReportingServiceLogTest, EndOfTheService) {
  EXPECT_THROW(post(client_, "killService", {}), platform::FakeTermination);

  EXPECT_THAT(logged(), ElementsAre("default hvrs: DESTROYING SERVICE"));
}

}  // namespace
}  // namespace halvox
