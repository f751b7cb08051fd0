#include "analysis/MessageJoin.h"

#include <string>
#include <vector>

#include "analysis/testing/RecordSeries.h"
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using ::testing::UnorderedElementsAre;

class MessageJoinTest : public testing::Test {
 protected:
  void addAll() {
    EXPECT_TRUE(records.forEach({}, [this](const Record& record) { join.add(record); }));
  }

  RecordSeries records;
  std::vector<std::int64_t> delivered;  // the IDs
  MessageJoin join{[this](const Message& message) { delivered.push_back(message.id); }};
};

TEST_F(MessageJoinTest, AMessageHasTheIDOfItsEventEvenIfTheLinkRecordedItFirst) {
  records.link({}, "Session_Playback", "Start");
  records.event({}, "Session_Playback", "Start");
  addAll();
  join.finish();

  EXPECT_THAT(delivered, ElementsAre(2));
}

TEST_F(MessageJoinTest, AMessageKnowsItsRecords) {
  std::vector<std::int64_t> ids;
  MessageJoin joining([&](const Message& message) {
    ids.insert(ids.end(), {message.commonID, message.serviceID, message.linkID});
  });
  records.message({}, "Session_Playback", "Start");                        // 1 to 3
  records.event({.sessionID = std::nullopt}, "Session_Playback", "Stop");  // 4 and 5
  records.summary({});                                                     // 6
  records.clientGone("player");                                            // 7
  EXPECT_TRUE(records.forEach({}, [&](const Record& record) { joining.add(record); }));
  joining.finish();

  EXPECT_THAT(ids, UnorderedElementsAre(1, 2, 3, 4, 5, 0, 0, 0, 6, 7, 0, 0));
}

TEST_F(MessageJoinTest, AMessageThatOnlyTheLinkRecordedHasTheIDOfThatRecord) {
  records.link({}, "Session_Playback", "Start");
  addAll();
  join.finish();

  EXPECT_THAT(delivered, ElementsAre(1));
}

TEST_F(MessageJoinTest, OnlyTheServiceMakesSummaries) {
  std::vector<bool> areSummaries;
  MessageJoin joining([&](const Message& message) { areSummaries.push_back(message.isSummary); });
  records.link({}, "Undefined", "Unknown", R"("HV_Session_Summary_Event":"7")");
  records.summary({});
  EXPECT_TRUE(records.forEach({}, [&](const Record& record) { joining.add(record); }));
  joining.finish();

  EXPECT_THAT(areSummaries, UnorderedElementsAre(false, true));
}

TEST_F(MessageJoinTest, ASummaryComesBeforeTheMessagesOfTheNextRunEvenIfItWasRecordedLater) {
  records.message({}, "Session_Playback", "Stop");             // 1 to 3
  records.event({}, "Session_Playback", "Start");              // 4 and 5, of the next run
  records.event({.sessionID = 8}, "Session_Record", "Start");  // 6 and 7
  records.summary({});                                         // 8
  records.link({.sessionID = 8}, "Session_Record", "Start");   // 9
  records.link({}, "Session_Playback", "Start");               // 10
  records.message({}, "Session_Playback", "State");            // 11 to 13
  addAll();
  join.finish();

  EXPECT_THAT(delivered, ElementsAre(1, 8, 4, 6, 11));
}

TEST_F(MessageJoinTest, SummariesOfSeveralRunsKeepTheirOrder) {
  records.event({}, "Session_Playback", "Start");
  records.summary({});
  records.summary({});
  records.link({}, "Session_Playback", "Start");
  records.summary({});
  addAll();
  join.finish();

  EXPECT_THAT(delivered, ElementsAre(3, 4, 1, 6));
}

TEST_F(MessageJoinTest, ALongSummaryDoesNotDisplaceTheMessagesThatWait) {
  records.event({}, "Session_Playback", "Start");
  records.summary({}, std::string(MessageJoin::kMostWaitingBytes + 1, '1'));
  addAll();
  EXPECT_THAT(delivered, IsEmpty());
  join.finish();

  EXPECT_THAT(delivered, ElementsAre(1, 3));
}

TEST_F(MessageJoinTest, AMessageWithoutItsOtherRecordIsDeliveredOnRequest) {
  records.at(100).event({}, "Session_Playback", "Start");
  records.at(102).event({}, "Session_Playback", "Stop");
  addAll();
  EXPECT_THAT(delivered, IsEmpty());

  join.deliverBefore(101);
  EXPECT_THAT(delivered, ElementsAre(1));
  join.deliverBefore(103);
  EXPECT_THAT(delivered, ElementsAre(1, 3));
}

TEST_F(MessageJoinTest, TheBytesOfWaitingMessagesAreBounded) {
  const std::string text(1U << 20U, 'x');
  constexpr std::size_t kMessages = 20;
  for (std::size_t number = 0; number < kMessages; ++number) {
    records.event({}, "Session_Playback", "Start", "\"text\":\"" + text + "\"");
  }
  addAll();

  // 15 of these wait: each has some bytes more than a mebibyte.
  EXPECT_THAT(delivered, SizeIs(kMessages - 15));
  join.finish();
  EXPECT_THAT(delivered, SizeIs(kMessages));
}

TEST_F(MessageJoinTest, APayloadAboveTheBoundWaitsAlone) {
  const std::string text(MessageJoin::kMostWaitingBytes + 1, 'x');
  records.event({}, "Session_Playback", "Start");
  records.event({}, "Session_Playback", "Start", "\"text\":\"" + text + "\"");
  addAll();

  EXPECT_THAT(delivered, ElementsAre(1));
  join.finish();
  EXPECT_THAT(delivered, ElementsAre(1, 3));
}

TEST_F(MessageJoinTest, AClockThatIsSetBackDoesNotStopTheDelivery) {
  records.event({}, "Session_Playback", "Start");
  addAll();
  EXPECT_THAT(delivered, IsEmpty());

  RecordSeries later;
  later.setClock(1'000'000 - 3600);
  later.event({}, "Session_Playback", "Stop");
  EXPECT_TRUE(later.forEach({}, [this](const Record& record) { join.add(record); }));
  EXPECT_THAT(delivered, SizeIs(1));
}

}  // namespace
}  // namespace halvox::analysis
