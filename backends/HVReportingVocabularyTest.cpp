#include "backends/HVReportingVocabulary.h"

#include <type_traits>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/log.h"

namespace halvox {
namespace {

using platform::FakeLogService;
using platform::LogCategory;
using platform::LogLevel;

class HVReportingVocabularyTest : public testing::Test {
 protected:
  // Logs a line to the category. Returns the subsystem and the category of that line, "a/b".
  std::string namesOf(LogCategory& category) {
    category.write(LogLevel::kError, "");
    const FakeLogService::Line line = platform_.log.lines().back();
    return line.subsystem + "/" + line.category;
  }

  platform::FakePlatform platform_;
};

TEST_F(HVReportingVocabularyTest, LogCategoriesHaveTheirNamesInTheSubsystem) {
  EXPECT_EQ(namesOf(HVReportingClientCategory()), "com.tarno.halvox/hvrc");
  EXPECT_EQ(namesOf(HVReportingServiceDelegateCategory()), "com.tarno.halvox/hvrs");
  EXPECT_EQ(namesOf(HVReportingSessionCategory()), "com.tarno.halvox/hvrr");
  EXPECT_EQ(namesOf(HVReportingSessionTLMReportingCategory()), "com.tarno.halvox/hvri");
  EXPECT_EQ(namesOf(HVReportingDriverUtilityCategory()), "com.tarno.halvox/hvrd");
  EXPECT_EQ(namesOf(HVReportingJoulebookCategory()), "com.tarno.halvox/hvrp");
  EXPECT_EQ(namesOf(HVReportingZUBLogCategory()), "com.tarno.halvox/hvra");
  EXPECT_EQ(namesOf(HVReportingVEKLogCategory()), "com.tarno.halvox/hvrb");
}

TEST_F(HVReportingVocabularyTest, LogCategoriesAreMadeOnce) {
  EXPECT_EQ(&HVReportingClientCategory(), &HVReportingClientCategory());
  EXPECT_EQ(&HVReportingServiceDelegateCategory(), &HVReportingServiceDelegateCategory());
  EXPECT_EQ(&HVReportingSessionCategory(), &HVReportingSessionCategory());
  EXPECT_EQ(&HVReportingSessionTLMReportingCategory(), &HVReportingSessionTLMReportingCategory());
  EXPECT_EQ(&HVReportingJoulebookCategory(), &HVReportingJoulebookCategory());
  EXPECT_EQ(&HVReportingZUBLogCategory(), &HVReportingZUBLogCategory());
  EXPECT_EQ(&HVReportingVEKLogCategory(), &HVReportingVEKLogCategory());
}

// The numbers are what clients send and what is stored: they never change.
template <typename Enumeration>
std::uint32_t number(Enumeration value) {
  return static_cast<std::uint32_t>(value);
}

TEST_F(HVReportingVocabularyTest, CategoriesAndDomainsHaveTheirNumbers) {
  EXPECT_EQ(number(AudioEventCategory::kUndefined), 0U);
  EXPECT_EQ(number(AudioEventCategory::kGeneric), 1U);
  EXPECT_EQ(number(AudioEventCategory::kRecord), 2U);
  EXPECT_EQ(number(AudioEventCategory::kInput), 3U);
  EXPECT_EQ(number(AudioEventCategory::kPlayback), 4U);
  EXPECT_EQ(number(AudioEventCategory::kOutput), 5U);
  EXPECT_EQ(number(AudioEventCategory::kPlaybackAndRecord), 6U);
  EXPECT_EQ(number(AudioEventCategory::kIO), 7U);
  EXPECT_EQ(number(AudioEventCategory::kSetup), 8U);
  EXPECT_EQ(number(AudioEventCategory::kClientRequest), 9U);
  EXPECT_EQ(number(AudioEventCategory::kRouteChange), 10U);
  EXPECT_EQ(number(AudioEventCategory::kError), 11U);
  EXPECT_EQ(number(AudioEventCategory::kIOReporting), 12U);
  EXPECT_EQ(number(AudioEventCategory::kPerformance), 13U);
  EXPECT_EQ(number(AudioEventCategory::kVolume), 14U);
  EXPECT_EQ(number(AudioEventCategory::kHearingHealth), 15U);
  EXPECT_EQ(number(AudioEventCategory::kMIDI), 0x04000000U);
  EXPECT_EQ(number(AudioEventCategory::kSession), 0x08000000U);
  EXPECT_EQ(number(AudioEventCategory::kDSP), 0x10000000U);
  EXPECT_EQ(number(AudioEventCategory::kHAL), 0x20000000U);
  EXPECT_EQ(number(AudioEventCategory::kRouting), 0x40000000U);
  EXPECT_EQ(number(AudioEventCategory::kToolbox), 0x80000000U);
}

TEST_F(HVReportingVocabularyTest, TypesHaveTheirNumbers) {
  EXPECT_EQ(number(AudioEventType::kStart), 1U);
  EXPECT_EQ(number(AudioEventType::kStop), 2U);
  EXPECT_EQ(number(AudioEventType::kActivate), 3U);
  EXPECT_EQ(number(AudioEventType::kDeactivate), 4U);
  EXPECT_EQ(number(AudioEventType::kSetup), 5U);
  EXPECT_EQ(number(AudioEventType::kError), 6U);
  EXPECT_EQ(number(AudioEventType::kIssueDetector), 7U);
  EXPECT_EQ(number(AudioEventType::kJoulebook), 8U);
  EXPECT_EQ(number(AudioEventType::kAudioUnitUsage), 9U);
  EXPECT_EQ(number(AudioEventType::kMIDIDriver), 10U);
  EXPECT_EQ(number(AudioEventType::kSummary), 11U);
  EXPECT_EQ(number(AudioEventType::kHeadphoneAudioExposure), 12U);
  EXPECT_EQ(number(AudioEventType::kAudioExposure), 13U);
  EXPECT_EQ(number(AudioEventType::kListeningEnhancement), 14U);
  EXPECT_EQ(number(AudioEventType::kDorvan), 15U);
  EXPECT_EQ(number(AudioEventType::kSimple), 16U);
  EXPECT_EQ(number(AudioEventType::kHistogram), 17U);
  EXPECT_EQ(number(AudioEventType::kState), 18U);
  EXPECT_EQ(number(AudioEventType::kUnknown), 65535U);
}

TEST_F(HVReportingVocabularyTest, ServiceTypesHaveTheirNumbers) {
  EXPECT_EQ(number(AudioServiceType::kGeneric), 0U);
  EXPECT_EQ(number(AudioServiceType::kQuillo), 1U);
  EXPECT_EQ(number(AudioServiceType::kTelephony), 2U);
  EXPECT_EQ(number(AudioServiceType::kHaptics), 3U);
  EXPECT_EQ(number(AudioServiceType::kAlarms), 4U);
  EXPECT_EQ(number(AudioServiceType::kStandalone), 5U);
  EXPECT_EQ(number(AudioServiceType::kSoundAutoConfig), 6U);
  EXPECT_EQ(number(AudioServiceType::kLongFormAudio), 7U);
  EXPECT_EQ(number(AudioServiceType::kNonLongFormAudio), 8U);
  EXPECT_EQ(number(AudioServiceType::kAudioDeviceUsage), 9U);
  EXPECT_EQ(number(AudioServiceType::kAlerts), 10U);
  EXPECT_EQ(number(AudioServiceType::kTest), 11U);
  EXPECT_EQ(number(AudioServiceType::kAPIUsage), 12U);
  EXPECT_EQ(number(AudioServiceType::kSystemSounds), 13U);
  EXPECT_EQ(number(AudioServiceType::kUnknown), 65535U);
}

TEST_F(HVReportingVocabularyTest, DomainAndCategoryAreJoinedBitwise) {
  constexpr auto kCategory = AudioEventCategory::kSession | AudioEventCategory::kPlayback;

  EXPECT_EQ(static_cast<std::uint32_t>(kCategory), 0x08000004U);
}

TEST_F(HVReportingVocabularyTest, IdentifiersAreNotInterchangeableWithNumbers) {
  EXPECT_FALSE((std::is_convertible_v<std::int64_t, ReporterID>));
  EXPECT_FALSE((std::is_convertible_v<ReporterID, std::int64_t>));
  EXPECT_EQ(kNoReporterID, ReporterID{0});
}

}  // namespace
}  // namespace halvox
