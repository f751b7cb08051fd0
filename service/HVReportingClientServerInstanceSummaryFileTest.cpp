#include <algorithm>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "service/ServiceFixture.h"

// What clients observe while the summary file of an internal build is being written. The process is
// an internal build because of HVReportingInternalBuildTest.cpp.
namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using testing::IsEmpty;
using testing::SizeIs;

class HVReportingClientServerInstanceSummaryFileTest : public ServiceFixture {
 protected:
  HVReportingClientServerInstanceSummaryFileTest() { startLong(7, AudioServiceType::kHaptics); }
  ~HVReportingClientServerInstanceSummaryFileTest() override { platform_.dispatch.clear(); }

  // Starts a session and records so many messages that its file has more than one part.
  void startLong(std::int64_t id, AudioServiceType type) {
    create(client_, id);
    setServiceType(client_, type, id);
    held_.push_back(start(client_, id));
    for (int number = 0; number < kMessages; ++number) {
      sessionOf(client_, id)
          ->sendMessage(Dictionary{{"n", number}}, AudioEventCategory::kPlayback,
                        AudioEventType::kStart, nullptr);
    }
    run();
    forgetSteps();
  }
  // Asks for the stop, and returns when the session is stopped and its file is being written.
  Call beginStop(std::int64_t id) {
    Call stop = post(client_, "stopReportingSessionForID", {id});
    const auto session = sessionOf(client_, id);
    while (session->started() && platform_.dispatch.runOne()) {
    }
    EXPECT_FALSE(session->started());
    EXPECT_THAT(platform_.files.files(), IsEmpty());
    return stop;
  }
  // Runs jobs until the call is answered.
  void runUntilAnswered(const Call& call) {
    while (!call->isAnswered() && platform_.dispatch.runOne()) {
    }
  }
  // The position of the first step that begins with that text.
  std::ptrdiff_t at(std::string_view text) const {
    const std::vector<std::string> all = steps();
    const auto found = std::ranges::find_if(
        all, [text](const std::string& step) { return step.starts_with(text); });
    EXPECT_NE(found, all.end()) << text;
    return found - all.begin();
  }

  static constexpr int kMessages = 12'000;
  Connection client_ = connect(100, "player");
  Connection other_ = connect(101, "other");
  std::vector<Call> held_;  // the replies to the starts
};

TEST_F(HVReportingClientServerInstanceSummaryFileTest, OtherClientsDoNotWaitForTheFile) {
  const Call stop = beginStop(7);

  const Call request = post(other_, "getAllReporters", {});
  runUntilAnswered(request);

  EXPECT_EQ(request->value(), Value(Array{7}));
  EXPECT_FALSE(stop->isAnswered());
  EXPECT_THAT(platform_.files.files(), IsEmpty());
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, TheFileThenTheEventThenTheReplies) {
  std::size_t filesAtReply = 0;
  platform_.journal.whenRecorded([&](const platform::JournalEntry& entry) {
    if (entry.text == "stopping 7") filesAtReply = platform_.files.files().size();
  });

  const Call stop = beginStop(7);
  EXPECT_FALSE(held_[0]->isAnswered());
  run();
  platform_.journal.whenRecorded(nullptr);

  EXPECT_EQ(filesAtReply, 1U);
  EXPECT_LT(at("ending session 7"), at("jsonOutput writeToURL: "));
  EXPECT_LT(at("jsonOutput writeToURL: "), at("sending summary event for reporter 7"));
  EXPECT_LT(at("sending summary event for reporter 7"), at("0 active reporting session(s) "));
  EXPECT_LT(at("0 active reporting session(s) "), at("stopping 7"));
  EXPECT_EQ(held_[0]->value(), Value(true));
  EXPECT_EQ(stop->value(), Value(true));
  EXPECT_THAT(platform_.files.files().at(0).objects, SizeIs(kMessages));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, RequestsOfTheClientWaitInOrder) {
  const Call stop = beginStop(7);

  const Call valid = post(client_, "reporterIDValid", {7});
  const std::vector<Value> lists{Array{7}};
  const Call message =
      post(client_, "sendMessage", {Dictionary{{"a", 1}}, kCategory, kType, Array(lists)});
  const Call start = post(client_, "startReportingSessionForID", {7});
  const Call last = post(other_, "getAllReporters", {});
  runUntilAnswered(last);
  EXPECT_FALSE(valid->isAnswered());
  EXPECT_FALSE(message->isAnswered());
  run();

  EXPECT_LT(at("stopping 7"), at("validating reporter 7"));
  EXPECT_LT(at("validating reporter 7"), at("sending message for reporter (7)"));
  EXPECT_LT(at("sending message for reporter (7)"), at("starting session for reporter 7"));
  EXPECT_TRUE(valid->isAnswered());
  EXPECT_TRUE(message->isAnswered());
  EXPECT_FALSE(start->isAnswered());
  EXPECT_TRUE(sessionOf(client_, 7)->started());
  EXPECT_THAT(platform_.files.files().at(0).objects, SizeIs(kMessages));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, OtherClientsFindAStoppedSession) {
  beginStop(7);
  const auto notStarted = [this] {
    return platform_.statistics.value("session", "not recorded: not started");
  };
  const auto before = notStarted();

  const std::vector<Value> lists{Array{7}};
  const Call message =
      post(other_, "sendMessage", {Dictionary{{"a", 1}}, kCategory, kType, Array(lists)});
  runUntilAnswered(message);

  EXPECT_EQ(notStarted(), before + 1);
  EXPECT_EQ(delegate_->activeSessionCount(), 0);
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
  run();
  EXPECT_THAT(platform_.files.files().at(0).objects, SizeIs(kMessages));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest,
       AClientThatDisconnectsIsRemovedAfterTheStop) {
  const Call stop = beginStop(7);

  client_->invalidate();
  runUntilAnswered(post(other_, "getAllReporters", {}));
  EXPECT_FALSE(platform_.log.containsText("removing 100 from the server client list"));
  run();

  EXPECT_LT(at("stopping 7"), at("removing 100 from the server client list"));
  EXPECT_TRUE(platform_.log.containsText("dealloc 100 from the server client list"));
  EXPECT_EQ(call(other_, "getAllReporters", {})->value(), Value(Array{}));
  EXPECT_THAT(platform_.files.files(), SizeIs(1));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, TheCleanUpWritesTheFilesOfAllSessions) {
  startLong(8, AudioServiceType::kAlarms);

  client_->invalidate();
  const Call request = post(other_, "getAllReporters", {});
  runUntilAnswered(request);
  EXPECT_THAT(platform_.files.files(), IsEmpty());
  run();

  EXPECT_THAT(platform_.files.files(), SizeIs(2));
  for (const std::string id : {"7", "8"}) {
    EXPECT_LT(at("sending summary event for reporter " + id),
              at("removing 100 from the server client list"));
  }
  EXPECT_EQ(delegate_->activeSessionCount(), 2);
  EXPECT_FALSE(held_[0]->isAnswered());
}

// The other client's session has the same ID. Looked up across all clients, the session of the
// client that registered first would come first.
TEST_F(HVReportingClientServerInstanceSummaryFileTest,
       TheSessionsOfAClientThatDisconnectsAreRemovedBeforeTheirFiles) {
  startLong(8, AudioServiceType::kAlarms);

  client_->invalidate();
  const Call request = post(other_, "getAllReporters", {});
  runUntilAnswered(request);
  runUntilAnswered(post(other_, "createReportingSession", {7}));

  EXPECT_EQ(request->value(), Value(Array{}));
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
  EXPECT_THAT(delegate_->getAllClients(), SizeIs(1));
  EXPECT_EQ(delegate_->findReportingSessionForID(ReporterID{7}), sessionOf(other_, 7));
  EXPECT_THAT(platform_.files.files(), IsEmpty());
  run();
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, TheCleanUpStopsOneSessionAfterTheOther) {
  startLong(8, AudioServiceType::kAlarms);

  client_->invalidate();
  run();

  // The order of a client's sessions is not defined.
  const bool isSevenFirst = at("ending session 7") < at("ending session 8");
  const std::string first = isSevenFirst ? "7" : "8";
  const std::string second = isSevenFirst ? "8" : "7";
  EXPECT_LT(at("sending summary event for reporter " + first), at("ending session " + second));
  EXPECT_LT(at("sending summary event for reporter " + second),
            at("removing 100 from the server client list"));
}

// The name of a file has the time of its stop. Sessions of one type differ in nothing else.
TEST_F(HVReportingClientServerInstanceSummaryFileTest, FilesThatTakeASecondHaveDifferentNames) {
  startLong(8, AudioServiceType::kHaptics);

  client_->invalidate();
  while (platform_.files.files().empty() && platform_.dispatch.runOne()) {
  }
  platform_.clock.advance(std::chrono::seconds(1));
  run();

  EXPECT_THAT(platform_.files.files(), SizeIs(2));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest,
       AClientThatDisconnectsDuringAStopIsRemovedAfterIt) {
  startLong(8, AudioServiceType::kAlarms);
  const Call stop = beginStop(7);

  client_->invalidate();
  run();

  EXPECT_THAT(platform_.files.files(), SizeIs(2));
  EXPECT_EQ(stop->value(), Value(true));
  EXPECT_LT(at("1 active reporting session(s) "), at("stopping 7"));
  EXPECT_LT(at("stopping 7"), at("ending session 8"));
  EXPECT_LT(at("sending summary event for reporter 8"),
            at("removing 100 from the server client list"));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest,
       TheRequestsOfAClientThatDisconnectsPrecedeItsCleanUp) {
  beginStop(7);
  post(client_, "startReportingSessionForID", {7});

  client_->interrupt();
  client_->invalidate();
  run();

  EXPECT_LT(at("starting session for reporter 7"), at("removing 100 from the server client list"));
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
  EXPECT_THAT(delegate_->getAllClients(), SizeIs(1));
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, AStopIsOpenUntilItIsAnswered) {
  const auto carriedOut = [this] { return platform_.statistics.value("requests", "carried out"); };
  const auto before = carriedOut();

  const Call stop = beginStop(7);
  runUntilAnswered(post(other_, "getAllReporters", {}));
  EXPECT_EQ(client_->openRequests(), 1U);
  EXPECT_EQ(carriedOut(), before + 1);
  runUntilAnswered(stop);

  EXPECT_EQ(client_->openRequests(), 0U);
  EXPECT_EQ(carriedOut(), before + 2);
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest,
       ADestroyedSessionIsRemovedBeforeItsFileAndAnsweredAfterIt) {
  const Call destroy = post(client_, "destroyReportingSession", {7});
  const Call request = post(other_, "getAllReporters", {});
  runUntilAnswered(request);
  EXPECT_FALSE(destroy->isAnswered());
  EXPECT_EQ(request->value(), Value(Array{}));
  EXPECT_THAT(delegate_->getAllActiveReportingSessions(), IsEmpty());
  EXPECT_EQ(client_->openRequests(), 1U);
  EXPECT_THAT(platform_.files.files(), IsEmpty());
  run();

  EXPECT_LT(at("sending summary event for reporter 7"), at("destroying 7"));
  EXPECT_EQ(destroy->value(), Value(true));
  EXPECT_EQ(call(other_, "getAllReporters", {})->value(), Value(Array{}));
  EXPECT_THAT(platform_.files.files(), SizeIs(1));
  EXPECT_FALSE(held_[0]->isAnswered());
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, AFileThatFailsDoesNotHoldTheClient) {
  platform_.files.setFileError(platform::Error{.description = "no space left"});

  const Call stop = beginStop(7);
  run();

  EXPECT_EQ(stop->value(), Value(true));
  EXPECT_TRUE(platform_.log.containsText("sending summary event for reporter 7"));
  EXPECT_EQ(clientOf(client_)->resourceUse().bytes, 0U);
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, AFileThatCannotBeBegunDoesNotHoldTheClient) {
  platform_.dispatch.failQueues("com.tarno.halvox.reporting.summaryfile");

  EXPECT_EQ(call(client_, "stopReportingSessionForID", {7})->value(), Value(true));
  EXPECT_TRUE(
      platform_.log.containsText("cannot write the summary file of reporter 7: std::bad_alloc"));
  EXPECT_TRUE(platform_.log.containsText("sending summary event for reporter 7"));
  EXPECT_TRUE(held_[0]->isAnswered());
  EXPECT_TRUE(call(client_, "getAllReporters", {})->isAnswered());
}

TEST_F(HVReportingClientServerInstanceSummaryFileTest, TheHistoryIsChargedUntilItIsReported) {
  beginStop(7);

  EXPECT_GT(clientOf(client_)->resourceUse().bytes, 10'000U);
  run();

  EXPECT_EQ(clientOf(client_)->resourceUse().bytes, 0U);
}

}  // namespace
}  // namespace halvox
