#include "tools/MessageFates.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using analysis::Message;

class MessageFatesTest : public testing::Test {
 protected:
  // A message that was recorded as an event, with a time stamp of its own.
  Message event(const std::string& members) {
    ++number_;
    Message message;
    message.id = number_;
    message.time = static_cast<double>(number_);
    message.service = "longformaudio";
    message.category = "Volume";
    message.type = "State";
    message.application = "player";
    message.isEvent = true;
    message.payload = "{" + members + ",\"hvreporting_timestamp\":" + std::to_string(number_) + "}";
    return message;
  }
  // The same, if it also went through the link of a session.
  Message linked(const std::string& members, std::int64_t session = 7) {
    Message message = event(members);
    message.isLinkMessage = true;
    message.sessionID = session;
    return message;
  }
  Message summary(std::int64_t session) {
    Message message = linked(R"("HV_Session_Summary_Event":"7")", session);
    message.isEvent = false;
    message.isSummary = true;
    message.category = "Undefined";
    message.type = "Unknown";
    return message;
  }
  LinkFate fateOf(const Message& message) {
    fates_.add(message);
    return last_;
  }

  std::int64_t number_ = 0;
  LinkFate last_ = LinkFate::kNotRecognised;
  std::optional<std::int64_t> session_;
  std::int64_t previous_ = 0;
  bool isExempt_ = false;
  bool equalsPrevious_ = false;
  MessageFates fates_{[this](const MessageFate& fate) {
    last_ = fate.link;
    session_ = fate.session;
    previous_ = fate.previous;
    isExempt_ = fate.isExempt;
    equalsPrevious_ = fate.equalsPrevious;
  }};
};

TEST_F(MessageFatesTest, TheLinkTakesMessagesInAndOutsideOfSessions) {
  EXPECT_EQ(fateOf(linked(R"("n":1)")), LinkFate::kSession);
  EXPECT_EQ(session_, 7);
  EXPECT_EQ(fateOf(linked(R"("n":2)", -1)), LinkFate::kSingle);
}

TEST_F(MessageFatesTest, AnEventThatEqualsTheRecordedMessageRepeatsIt) {
  fateOf(linked(R"("n":1)"));

  EXPECT_EQ(fateOf(event(R"("n":1,"HostApplicationDisplayID":"player")")), LinkFate::kRepeats);
  EXPECT_EQ(session_, 7);
  EXPECT_EQ(previous_, 1);
  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kRepeats);
  EXPECT_EQ(previous_, 1);
}

TEST_F(MessageFatesTest, OnlyTheNewestRecordedMessageOfASessionCounts) {
  fateOf(linked(R"("n":1)"));
  fateOf(linked(R"("n":2)"));

  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kNotRecognised);
}

TEST_F(MessageFatesTest, EachSessionHasItsOwnNewestMessage) {
  fateOf(linked(R"("n":1)", 7));
  fateOf(linked(R"("n":2)", 8));

  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kRepeats);
  EXPECT_EQ(session_, 7);
}

TEST_F(MessageFatesTest, WhichOfTwoSessionsDroppedARepetitionIsNotKnown) {
  fateOf(linked(R"("n":1)", 7));
  fateOf(linked(R"("n":1)", 8));

  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kRepeats);
  EXPECT_EQ(session_, std::nullopt);
  EXPECT_EQ(previous_, 2);
}

TEST_F(MessageFatesTest, AMessageThatASessionWithoutALinkMayHaveSentIsNotSaidToBeDropped) {
  fateOf(linked(R"("n":1)", 7));
  EXPECT_EQ(fateOf(event(R"("n":2)")), LinkFate::kNotRecognised);

  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kMayRepeat);
  EXPECT_EQ(session_, std::nullopt);
  EXPECT_EQ(previous_, 1);
  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kEqualsEvent)
      << "whoever recorded the one before drops this one";
}

TEST_F(MessageFatesTest, AnEqualMessageThatASessionRecordedNeverthelessIsNotSaidToDiffer) {
  fateOf(linked(R"("n":1)"));
  fateOf(linked(R"("n":1)"));  // the service was killed between the two
  EXPECT_TRUE(equalsPrevious_);
  EXPECT_EQ(previous_, 1);

  fateOf(linked(R"("n":2)"));
  EXPECT_FALSE(equalsPrevious_);
}

TEST_F(MessageFatesTest, ASummaryEndsTheComparisonWithItsSession) {
  fateOf(linked(R"("n":1)"));
  fateOf(summary(7));

  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kNotRecognised);
}

TEST_F(MessageFatesTest, EventsOfASessionWithoutALinkAreComparedWithEachOther) {
  fateOf(event(R"("n":1)"));

  EXPECT_EQ(fateOf(event(R"("n":1)")), LinkFate::kEqualsEvent);
  EXPECT_EQ(previous_, 1);
  EXPECT_EQ(fateOf(event(R"("n":2)")), LinkFate::kNotRecognised);
}

TEST_F(MessageFatesTest, ErrorsAreNeverRepetitions) {
  for (const auto& [category, type] : {std::pair("Error", "State"), std::pair("Volume", "Error")}) {
    Message first = linked(R"("n":1)");
    Message again = event(R"("n":1)");
    first.category = again.category = category;
    first.type = again.type = type;
    fateOf(first);

    EXPECT_EQ(fateOf(again), LinkFate::kNotRecognised) << category << type;
    EXPECT_TRUE(isExempt_);
  }
}

TEST_F(MessageFatesTest, OtherApplicationsAndTypesAreNotCompared) {
  fateOf(linked(R"("n":1)"));
  Message other = event(R"("n":1)");
  other.application = "browser";
  EXPECT_EQ(fateOf(other), LinkFate::kNotRecognised);
  other = event(R"("n":1)");
  other.type = "Start";
  EXPECT_EQ(fateOf(other), LinkFate::kNotRecognised);
}

TEST_F(MessageFatesTest, KeysAreComparedAsTheSessionHasThem) {
  fateOf(linked(R"("a b":1)"));

  EXPECT_EQ(fateOf(event(R"("a_b":1)")), LinkFate::kRepeats);
}

TEST_F(MessageFatesTest, SessionsOfTypeTestDoNotUseTheLink) {
  Message message = event(R"("n":1)");
  message.service = "test";

  EXPECT_EQ(fateOf(message), LinkFate::kTestSession);
}

TEST_F(MessageFatesTest, WithoutAStampNothingIsDecided) {
  Message message = event(R"("n":1)");
  message.payload = R"({"n":1})";

  EXPECT_EQ(fateOf(message), LinkFate::kWithoutStamp);
  message.payload = "not JSON";
  EXPECT_EQ(fateOf(message), LinkFate::kNotRecognised);
}

TEST_F(MessageFatesTest, MemoryIsBounded) {
  for (std::size_t base = 0; base <= MessageFates::kMostBases; ++base) {
    Message message = linked(R"("n":1)");
    message.application = std::to_string(base);
    fateOf(message);
  }
  Message first = event(R"("n":1)");
  first.application = "0";
  EXPECT_EQ(fateOf(first), LinkFate::kNotRecognised);  // the comparison began anew

  for (std::size_t session = 0; session <= MessageFates::kMostSessions; ++session) {
    fateOf(linked("\"n\":" + std::to_string(session), static_cast<std::int64_t>(session + 1)));
  }
  EXPECT_EQ(fateOf(event(R"("n":0)")), LinkFate::kNotRecognised);
}

}  // namespace
}  // namespace halvox::tools
