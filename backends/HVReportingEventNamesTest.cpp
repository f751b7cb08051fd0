#include "backends/HVReportingEventNames.h"

#include <gtest/gtest.h>

namespace halvox {
namespace {

TEST(HVReportingEventNamesTest, NamesConsistOfServiceCategoryAndType) {
  const HVReportingEventNames names(AudioEventCategory::kSession | AudioEventCategory::kPlayback,
                                    AudioEventType::kStart, AudioServiceType::kHaptics);

  EXPECT_EQ(names.ofAll.text(), "com.tarno.halvox.Session_Playback.Start");
  EXPECT_EQ(names.ofService.text(), "com.tarno.haptics.Session_Playback.Start");
}

TEST(HVReportingEventNamesTest, UnlistedNumbersHaveNamesToo) {
  const HVReportingEventNames names(AudioEventCategory{0}, AudioEventType{0}, AudioServiceType{14});

  EXPECT_EQ(names.ofAll.text(), "com.tarno.halvox.Undefined.Generic");
  EXPECT_EQ(names.ofService.text(), "com.tarno.telephony.Undefined.Generic");
}

}  // namespace
}  // namespace halvox
