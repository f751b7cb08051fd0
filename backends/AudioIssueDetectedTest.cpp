#include "backends/AudioIssueDetected.h"

#include <limits>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "backends/StringHash.h"
#include "backends/testdata/RandomIssue.h"

namespace halvox::zubmetrics {
namespace {

using platform::ProtoReader;
using platform::ProtoTextFormatter;
using platform::ProtoWriter;
using Bytes = std::vector<std::uint8_t>;

constexpr std::uint64_t kAllBits = std::numeric_limits<std::uint64_t>::max();

Bytes written(const AudioIssueDetected& issue) {
  ProtoWriter writer;
  issue.writeTo(writer);
  Bytes bytes;
  for (const std::byte byte : writer.bytes()) bytes.push_back(std::to_integer<std::uint8_t>(byte));
  return bytes;
}

// Merges the bytes into the message. Returns true if there was no error.
bool readInto(AudioIssueDetected& issue, const Bytes& bytes) {
  ProtoReader reader(std::as_bytes(std::span(bytes)));
  return issue.readFrom(reader);
}

AudioIssueDetected readOrFail(const Bytes& bytes) {
  AudioIssueDetected issue;
  EXPECT_TRUE(readInto(issue, bytes));
  return issue;
}

std::string textOf(const AudioIssueDetected& issue) {
  ProtoTextFormatter formatter;
  issue.formatText(formatter, "issue");
  return formatter.text();
}

AudioIssueDetected fullIssue() {
  AudioIssueDetected issue;
  issue.setIssueType("glitch");
  issue.setNode("mixer");
  issue.setRtaidClient("x");
  issue.setTimestamp(300);
  issue.setDuration(12);
  return issue;
}

// Each differs from fullIssue() in one field.
std::vector<AudioIssueDetected> issuesThatDiffer() {
  std::vector<AudioIssueDetected> issues(6, fullIssue());
  issues[0].setIssueType("glitcH");
  issues[1].setNode("mixer2");
  issues[2].setRtaidClient("");
  issues[3].setTimestamp(301);
  issues[4].clearTimestamp();
  issues[5].setDuration(-12);
  return issues;
}

// --- Value --------------------------------------------------------------------------------------

TEST(AudioIssueDetectedTest, ANewMessageIsEmptyAndHasNoTimestamp) {
  const AudioIssueDetected issue;

  EXPECT_EQ(issue.issueType(), "");
  EXPECT_EQ(issue.node(), "");
  EXPECT_EQ(issue.rtaidClient(), "");
  EXPECT_EQ(issue.timestamp(), std::nullopt);
  EXPECT_EQ(issue.duration(), 0);
}

TEST(AudioIssueDetectedTest, MessagesOfEqualFieldsAreEqualAndHashEqual) {
  EXPECT_EQ(fullIssue(), fullIssue());
  EXPECT_EQ(fullIssue().hash_value(), fullIssue().hash_value());
}

TEST(AudioIssueDetectedTest, EachFieldMakesADifference) {
  for (const AudioIssueDetected& other : issuesThatDiffer()) {
    EXPECT_FALSE(fullIssue() == other) << textOf(other);
    EXPECT_NE(fullIssue().hash_value(), other.hash_value()) << textOf(other);
  }
}

TEST(AudioIssueDetectedTest, ATimestampOfZeroDiffersFromNone) {
  AudioIssueDetected zero;
  zero.setTimestamp(0);

  EXPECT_FALSE(zero == AudioIssueDetected());
}

TEST(AudioIssueDetectedTest, AnAbsentTimestampsOldValueIsIgnored) {
  AudioIssueDetected forgotten;
  forgotten.setTimestamp(77);
  forgotten.clearTimestamp();

  EXPECT_EQ(forgotten.timestamp(), std::nullopt);
  EXPECT_EQ(forgotten, AudioIssueDetected());
  EXPECT_EQ(forgotten.hash_value(), AudioIssueDetected().hash_value());
  EXPECT_EQ(written(forgotten), written(AudioIssueDetected()));
}

TEST(AudioIssueDetectedTest, TheHashJoinsNumbersAndTextHashesBitByBit) {
  const std::uint64_t texts = hashString("glitch") ^ hashString("mixer") ^ hashString("x");
  EXPECT_EQ(fullIssue().hash_value(), texts ^ 300U ^ 12U);

  AudioIssueDetected negative = fullIssue();
  negative.setDuration(-1);
  EXPECT_EQ(negative.hash_value(), texts ^ 300U ^ kAllBits);
}

TEST(AudioIssueDetectedTest, CopiesAreEqualAndIndependent) {
  const AudioIssueDetected original = fullIssue();
  AudioIssueDetected copy(original);
  AudioIssueDetected assigned;
  assigned = original;
  EXPECT_EQ(copy, original);
  EXPECT_EQ(assigned, original);

  copy.setNode("other");
  assigned.clearTimestamp();
  EXPECT_EQ(original, fullIssue());
}

TEST(AudioIssueDetectedTest, AssigningAMessageToItselfChangesNothing) {
  AudioIssueDetected issue = fullIssue();
  AudioIssueDetected& same = issue;

  issue = same;
  EXPECT_EQ(issue, fullIssue());
  issue = std::move(same);
  EXPECT_EQ(issue, fullIssue());
}

// Tests short and long texts: std::string moves those within the object in a different way.
TEST(AudioIssueDetectedTest, AMovedFromMessageHasNoTextsAndNoTimestamp) {
  for (const std::string& node : {std::string("mixer"), std::string(100, 'n')}) {
    AudioIssueDetected first = fullIssue();
    first.setNode(node);
    const AudioIssueDetected original = first;

    AudioIssueDetected second(std::move(first));
    EXPECT_EQ(second, original);
    // NOLINTNEXTLINE(bugprone-use-after-move): the test is about the moved-from state
    EXPECT_EQ(first.issueType() + first.node() + first.rtaidClient(), "");
    EXPECT_EQ(first.timestamp(), std::nullopt);

    AudioIssueDetected third;
    third = std::move(second);
    EXPECT_EQ(third, original);
    // NOLINTNEXTLINE(bugprone-use-after-move): the test is about the moved-from state
    EXPECT_EQ(second.issueType() + second.node() + second.rtaidClient(), "");
    EXPECT_EQ(second.timestamp(), std::nullopt);
  }
}

TEST(AudioIssueDetectedTest, SwapExchangesAllFieldsAndPresence) {
  AudioIssueDetected left = fullIssue();
  AudioIssueDetected right;

  swap(left, right);

  EXPECT_EQ(left, AudioIssueDetected());
  EXPECT_EQ(right, fullIssue());
}

// --- Writing ------------------------------------------------------------------------------------

TEST(AudioIssueDetectedTest, ADefaultMessageIsWrittenWithItsEmptyFields) {
  EXPECT_EQ(written({}), (Bytes{0x10, 0x00, 0x1A, 0x00, 0x22, 0x00, 0x2A, 0x00}));
}

TEST(AudioIssueDetectedTest, FieldsAreWrittenInTheOrderOfTheirNumbers) {
  EXPECT_EQ(written(fullIssue()),
            (Bytes{0x08, 0xAC, 0x02, 0x10, 0x0C, 0x1A, 6,   'g', 'l',  'i', 't', 'c',
                   'h',  0x22, 5,    'm',  'i',  'x',  'e', 'r', 0x2A, 1,   'x'}));
}

TEST(AudioIssueDetectedTest, ANegativeDurationIsWrittenInTenBytes) {
  AudioIssueDetected issue;
  issue.setDuration(-1);

  EXPECT_EQ(written(issue), (Bytes{0x10, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x01,
                                   0x1A, 0x00, 0x22, 0x00, 0x2A, 0x00}));
}

TEST(AudioIssueDetectedTest, ATimestampOfZeroIsWritten) {
  AudioIssueDetected issue;
  issue.setTimestamp(0);

  EXPECT_EQ(written(issue), (Bytes{0x08, 0x00, 0x10, 0x00, 0x1A, 0x00, 0x22, 0x00, 0x2A, 0x00}));
}

// --- Reading ------------------------------------------------------------------------------------

TEST(AudioIssueDetectedTest, ReadingNoBytesChangesNothing) {
  AudioIssueDetected issue = fullIssue();

  EXPECT_TRUE(readInto(issue, {}));
  EXPECT_EQ(issue, fullIssue());
}

TEST(AudioIssueDetectedTest, ADurationOfMoreThan32BitsKeepsTheLowOnes) {
  EXPECT_EQ(readOrFail({0x10, 0x85, 0x80, 0x80, 0x80, 0x10}).duration(), 5);
}

TEST(AudioIssueDetectedTest, TheEndOfAGroupEndsTheMessageWithoutAnError) {
  const AudioIssueDetected issue = readOrFail({0x10, 0x05, 0x0C, 0x10, 0x07});

  EXPECT_EQ(issue.duration(), 5);
}

TEST(AudioIssueDetectedTest, UnknownFieldsOfEveryWireTypeAreSkipped) {
  const AudioIssueDetected issue = readOrFail({
      0x30, 0x96, 0x01,                       // varint
      0x39, 1,    2,    3,    4, 5, 6, 7, 8,  // 64 bits
      0x42, 2,    0x10, 0x63,                 // bytes that look like a duration
      0x4B, 0x10, 0x63, 0x4C,                 // a group with a duration of its own
      0x55, 1,    2,    3,    4,              // 32 bits
      0x10, 0x0C,
  });

  EXPECT_EQ(issue.duration(), 12);
}

TEST(AudioIssueDetectedTest, AnUnknownFieldThatCannotBeSkippedIsAnError) {
  AudioIssueDetected issue;

  EXPECT_FALSE(readInto(issue, {0x10, 0x0C, 0x36, 0x00, 0x10, 0x07}));  // wire type 6
  EXPECT_EQ(issue.duration(), 12);
}

TEST(AudioIssueDetectedTest, TheWireTypeOfAKnownFieldIsNotChecked) {
  const AudioIssueDetected issue =
      readOrFail({0x0D, 0x2A, 0x15, 0x05, 0x18, 0x01, 'g', 0x23, 0x01, 'm', 0x29, 0x01, 'x'});

  EXPECT_EQ(issue.timestamp(), 42U);
  EXPECT_EQ(issue.duration(), 5);
  EXPECT_EQ(issue.issueType() + issue.node() + issue.rtaidClient(), "gmx");
}

TEST(AudioIssueDetectedTest, TheLastOfRepeatedFieldsCounts) {
  const AudioIssueDetected issue = readOrFail({0x22, 2, 'a', 'b', 0x10, 1, 0x22, 1, 'c', 0x10, 2});

  EXPECT_EQ(issue.node(), "c");
  EXPECT_EQ(issue.duration(), 2);
}

TEST(AudioIssueDetectedTest, FieldsBeforeAnErrorKeepTheirNewValues) {
  AudioIssueDetected issue = fullIssue();

  EXPECT_FALSE(readInto(issue, {0x08, 0x05, 0x1A, 0x01, 'n', 0x22, 0x7F, 'm'}));
  EXPECT_EQ(issue.timestamp(), 5U);
  EXPECT_EQ(issue.issueType(), "n");
  EXPECT_EQ(issue.node(), "mixer");
}

TEST(AudioIssueDetectedTest, ATruncatedTimestampIsPresentWithTheValueZero) {
  AudioIssueDetected issue;

  EXPECT_FALSE(readInto(issue, {0x08, 0x85}));
  EXPECT_EQ(issue.timestamp(), 0U);
}

TEST(AudioIssueDetectedTest, ATagThatRunsLongerThanTenBytesIsFieldZeroAndSkipped) {
  Bytes bytes(10, 0xFF);
  bytes.insert(bytes.end(), {0x07, 0x10, 0x0C});  // the skipped value and a duration

  EXPECT_EQ(readOrFail(bytes).duration(), 12);
}

// A cut between two fields leaves a shorter message; any other cut is an error.
TEST(AudioIssueDetectedTest, ACutAtEveryByteIsAnErrorExceptBetweenFields) {
  const Bytes whole = written(fullIssue());
  const std::vector<std::size_t> ends{0, 3, 5, 13, 20, 23};
  ASSERT_EQ(whole.size(), ends.back());

  for (std::size_t length = 0; length <= whole.size(); ++length) {
    AudioIssueDetected issue;
    const Bytes cut(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length));
    EXPECT_EQ(readInto(issue, cut), std::ranges::find(ends, length) != ends.end()) << length;
  }
}

TEST(AudioIssueDetectedTest, AMillionMessagesAreReadAsTheyWereWritten) {
  RandomIssues issues(/*seed=*/20, /*longestText=*/10);
  for (int count = 0; count < 1'000'000; ++count) {
    const AudioIssueDetected issue = issues.next();
    ProtoWriter writer;
    issue.writeTo(writer);
    ProtoReader reader(writer.bytes());
    AudioIssueDetected again;
    ASSERT_TRUE(again.readFrom(reader)) << textOf(issue);
    ASSERT_EQ(reader.position(), reader.end());
    ASSERT_EQ(again, issue) << textOf(issue) << textOf(again);
  }
}

// --- Text ---------------------------------------------------------------------------------------

TEST(AudioIssueDetectedTest, TheTextHasTheFieldsInAlphabeticalOrder) {
  EXPECT_EQ(textOf(fullIssue()),
            "issue {\n"
            "  duration: 12\n"
            "  issuetype: \"glitch\"\n"
            "  node: \"mixer\"\n"
            "  rtaidclient: \"x\"\n"
            "  timestamp: 300\n"
            "}\n");
}

TEST(AudioIssueDetectedTest, TheTextOmitsOnlyAnAbsentTimestamp) {
  EXPECT_EQ(textOf({}),
            "issue {\n  duration: 0\n  issuetype: \"\"\n  node: \"\"\n  rtaidclient: \"\"\n}\n");
}

}  // namespace
}  // namespace halvox::zubmetrics
