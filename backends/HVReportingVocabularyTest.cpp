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
