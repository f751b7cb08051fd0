#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;

constexpr auto kSessionPlayback = AudioEventCategory::kSession | AudioEventCategory::kPlayback;

std::vector<std::string> keysOf(const Dictionary& dictionary) {
  std::vector<std::string> keys;
  for (const Dictionary::Entry& entry : dictionary) keys.emplace_back(entry.key.text());
  return keys;
}

// --- Application name ---------------------------------------------------------------------------

TEST(HVReportingUtilityRetrieveAppNameTest, IsTheValueUnderItsKey) {
  const Dictionary configuration{{"HostApplicationDisplayID", "com.example.player"}, {"a", 1}};

  EXPECT_EQ(HVReportingUtilityRetrieveAppName(configuration), Value("com.example.player"));
}

TEST(HVReportingUtilityRetrieveAppNameTest, IsUnknownWithoutTheKey) {
  EXPECT_EQ(HVReportingUtilityRetrieveAppName({}), Value("Unknown"));
  EXPECT_EQ(HVReportingUtilityRetrieveAppName({{"hostapplicationdisplayid", "A"}}),
            Value("Unknown"));
}

TEST(HVReportingUtilityRetrieveAppNameTest, KeepsAValueOfAnotherKindAndAnEmptyText) {
  EXPECT_EQ(HVReportingUtilityRetrieveAppName({{"HostApplicationDisplayID", 17}}), Value(17));
  EXPECT_EQ(HVReportingUtilityRetrieveAppName({{"HostApplicationDisplayID", ""}}), Value(""));
}

// --- Audio tag ----------------------------------------------------------------------------------

TEST(HVReportingUtilityAddAudioMessageTagTest, TagIsCategoryAndTypeWithoutSeparator) {
  const Dictionary tagged =
      HVReportingUtilityAddAudioMessageTag({{"a", 1}}, kSessionPlayback, AudioEventType::kStart);

  EXPECT_EQ(tagged, (Dictionary{{"a", 1}, {"audiotag", "Session_PlaybackStart"}}));
}

TEST(HVReportingUtilityAddAudioMessageTagTest, ReplacesATagThatIsThere) {
  const Dictionary message{{"audiotag", 5}, {"a", 1}};

  const Dictionary tagged = HVReportingUtilityAddAudioMessageTag(
      message, AudioEventCategory::kUndefined, AudioEventType::kStop);

  EXPECT_EQ(tagged, (Dictionary{{"audiotag", "UndefinedStop"}, {"a", 1}}));
}

TEST(HVReportingUtilityAddAudioMessageTagTest, LeavesTheInputAlone) {
  const Dictionary message{{"a", 1}};

  static_cast<void>(
      HVReportingUtilityAddAudioMessageTag(message, kSessionPlayback, AudioEventType::kStart));

  EXPECT_EQ(message, (Dictionary{{"a", 1}}));
}

TEST(HVReportingUtilityAddAudioMessageTagTest, TagsAnEmptyMessage) {
  EXPECT_EQ(HVReportingUtilityAddAudioMessageTag({}, kSessionPlayback, AudioEventType::kUnknown),
            (Dictionary{{"audiotag", "Session_PlaybackUnknown"}}));
}

// --- Blanks in keys -----------------------------------------------------------------------------

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, EveryBlankBecomesAnUnderscore) {
  const Dictionary cleaned =
      HVReportingUtilityRemoveWhiteSpaceFromKeys({{"a b", 1}, {" c  d ", 2}, {"e", 3}});

  EXPECT_EQ(cleaned, (Dictionary{{"a_b", 1}, {"_c__d_", 2}, {"e", 3}}));
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, OtherWhiteSpaceStays) {
  const Dictionary message{{"a\tb", 1}, {"c\nd", 2}, {"e\u00A0f", 3}, {"g\rh", 4}};

  EXPECT_EQ(HVReportingUtilityRemoveWhiteSpaceFromKeys(message), message);
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, OfKeysThatBecomeEqualTheLaterWins) {
  EXPECT_EQ(HVReportingUtilityRemoveWhiteSpaceFromKeys({{"a b", 1}, {"a_b", 2}}),
            (Dictionary{{"a_b", 2}}));
  EXPECT_EQ(HVReportingUtilityRemoveWhiteSpaceFromKeys({{"a_b", 2}, {"a b", 1}}),
            (Dictionary{{"a_b", 1}}));
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, KeepsTheOrderOfEntries) {
  const Dictionary cleaned =
      HVReportingUtilityRemoveWhiteSpaceFromKeys({{"z", 1}, {"b a", 2}, {"a", 3}});

  EXPECT_EQ(keysOf(cleaned), (std::vector<std::string>{"z", "b_a", "a"}));
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, ValuesAndKeysInsideValuesStay) {
  const Value inner = Dictionary{{"in ner", "a b"}};

  EXPECT_EQ(HVReportingUtilityRemoveWhiteSpaceFromKeys({{"out er", inner}}),
            (Dictionary{{"out_er", inner}}));
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, LeavesTheInputAlone) {
  const Dictionary message{{"a b", 1}};

  static_cast<void>(HVReportingUtilityRemoveWhiteSpaceFromKeys(message));

  EXPECT_EQ(message, (Dictionary{{"a b", 1}}));
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, WithoutBlanksTheResultSharesTheInput) {
  const Dictionary message{{"a", 1}, {"b", "c d"}};

  EXPECT_TRUE(HVReportingUtilityRemoveWhiteSpaceFromKeys(message).isIdenticalTo(message));
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, TheResultCanBeChangedWithoutTheInput) {
  const Dictionary message{{"a", 1}};
  Dictionary cleaned = HVReportingUtilityRemoveWhiteSpaceFromKeys(message);

  cleaned.set("b", 2);

  EXPECT_EQ(message, (Dictionary{{"a", 1}}));
  EXPECT_EQ(cleaned.size(), 2U);
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, EmptyStaysEmpty) {
  EXPECT_TRUE(HVReportingUtilityRemoveWhiteSpaceFromKeys({}).empty());
}

TEST(HVReportingUtilityRemoveWhiteSpaceFromKeysTest, CleaningTwiceChangesNothingMore) {
  const Dictionary once = HVReportingUtilityRemoveWhiteSpaceFromKeys({{"a b c", 1}, {" ", 2}});

  EXPECT_TRUE(HVReportingUtilityRemoveWhiteSpaceFromKeys(once).isIdenticalTo(once));
}

}  // namespace
}  // namespace halvox
