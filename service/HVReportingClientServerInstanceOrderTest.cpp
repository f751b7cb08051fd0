#include <functional>
#include <string>
#include <vector>

#include "service/DelegateFixture.h"

namespace halvox {
namespace {

using testing::ElementsAre;

constexpr ReporterID kReporter{7};

// Records its calls in order, each with the state of the session at that moment.
class NotingDelegate final : public TestDelegate {
 public:
  [[nodiscard]] platform::Message getFeaturesState() const override {
    note("features");
    return std::nullopt;
  }
  [[nodiscard]] Sessions getAllActiveReportingSessions() const override {
    note("active sessions");
    return {};
  }
  void removeClient(const HVReportingClientServerInstance& /*client*/) override {
    note("client removed");
  }
  void setActiveSessionCount(std::int64_t count) override {
    TestDelegate::setActiveSessionCount(count);
    note("count " + std::to_string(count));
  }
  [[nodiscard]] DriverSnapShot getSnapShot() const override {
    note("snapshot");
    return {};
  }
  void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& /*session*/) override {
    note("driver logs");
  }
  void noteSessionChange(const HVReportingClientServerInstance& /*client*/,
                         const std::shared_ptr<HVReportingSession>& /*session*/,
                         SessionChange change) override {
    switch (change) {
      case SessionChange::kAdded:
        return note("added");
      case SessionChange::kRemoved:
        return note("removed");
      case SessionChange::kStarted:
        return note("started");
      case SessionChange::kStopped:
        return note("stopped");
    }
  }

  void note(const std::string& what) const { notes.push_back(what + ": " + state()); }

  std::function<std::string()> state;
  mutable std::vector<std::string> notes;
};

class HVReportingClientServerInstanceOrderTest : public DelegateFixture<NotingDelegate> {
 protected:
  HVReportingClientServerInstanceOrderTest() {
    delegate_->clients.push_back(client_);
    delegate_->state = [this] { return state(); };
  }

  // The state of the session: any of "runs, link, snapshot, held reply".
  std::string state() const {
    const auto session = client_->findReportingSessionForID(
        kReporter, HVReportingClientServerInstance::Lookup::kOwnSessions);
    if (session == nullptr) return "none";
    std::string text = session->started() ? "runs" : "idle";
    if (session->tlmReportingEnabled()) text += ", link";
    if (session->driverSnapShot().has_value()) text += ", snapshot";
    if (session->transactionCompleteBlock()) text += ", held reply";
    return text;
  }
  BoolReply reply(const std::string& name) {
    return [this, name](const auto& /*error*/, bool /*value*/) { delegate_->note(name); };
  }
  std::vector<std::string> notesOf(const std::function<void()>& request) {
    delegate_->notes.clear();
    request();
    run();
    return delegate_->notes;
  }
  void create() {
    client_->createReportingSession(kReporter, reply("reply of create"), {});
    run();
  }
  void start(const std::string& name = "reply of start") {
    client_->startReportingSessionForID(kReporter, reply(name), {});
    run();
  }
};

TEST_F(HVReportingClientServerInstanceOrderTest, SessionHasItsLinkWhenTheCreateIsAnswered) {
  EXPECT_THAT(notesOf([this] { create(); }),
              ElementsAre("added: idle", "reply of create: idle, link"));
}

// The counter decides about the link before the session starts. The snapshot is taken before the
// reply is held, and the state of the features comes last.
TEST_F(HVReportingClientServerInstanceOrderTest, StepsOfAStartAreInOrder) {
  create();

  EXPECT_THAT(notesOf([this] { start(); }),
              ElementsAre("count 1: idle, link", "started: runs, link", "snapshot: runs, link",
                          "features: runs, link, snapshot, held reply",
                          "active sessions: runs, link, snapshot, held reply"));
}

TEST_F(HVReportingClientServerInstanceOrderTest, HeldReplyIsDeliveredBeforeTheNextIsHeld) {
  create();
  start();
  const auto session = client_->findReportingSessionForID(
      kReporter, HVReportingClientServerInstance::Lookup::kOwnSessions);
  session->stop();  // not through the client, so that the reply stays held

  EXPECT_THAT(notesOf([this] { start("reply of the second start"); }),
              ElementsAre("count 2: idle, link, snapshot, held reply",
                          "started: runs, link, snapshot, held reply",
                          "snapshot: runs, link, snapshot, held reply",
                          "reply of start: runs, link, snapshot",
                          "features: runs, link, snapshot, held reply",
                          "active sessions: runs, link, snapshot, held reply"));
}

TEST_F(HVReportingClientServerInstanceOrderTest, StepsOfAStopAreInOrder) {
  create();
  start();

  EXPECT_THAT(notesOf([this] {
                client_->stopReportingSessionForID(kReporter, reply("reply of stop"), {});
              }),
              ElementsAre("driver logs: runs, link, snapshot, held reply",
                          "stopped: idle, link, held reply", "count 0: idle, link, held reply",
                          "reply of start: idle, link", "active sessions: idle, link",
                          "reply of stop: idle, link"));
}

TEST_F(HVReportingClientServerInstanceOrderTest, DestroyStopsThenForgetsThenAnswers) {
  create();
  start();

  EXPECT_THAT(notesOf([this] {
                client_->destroyReportingSession(kReporter, reply("reply of destroy"), {});
              }),
              ElementsAre("removed: idle, link, snapshot, held reply", "reply of destroy: none"));
}

TEST_F(HVReportingClientServerInstanceOrderTest,
       LostConnectionStopsThenForgetsThenRemovesTheClient) {
  create();
  start();

  EXPECT_THAT(notesOf([this] { client_->handleConnectionError(); }),
              ElementsAre("removed: idle, link, snapshot, held reply", "client removed: none"));
}

TEST_F(HVReportingClientServerInstanceOrderTest, SessionInThePlaceOfAnotherComesAfterItsRemoval) {
  create();
  start();

  EXPECT_THAT(notesOf([this] { create(); }),
              ElementsAre("removed: runs, link, snapshot, held reply", "added: idle",
                          "reply of create: idle, link"));
}

}  // namespace
}  // namespace halvox
