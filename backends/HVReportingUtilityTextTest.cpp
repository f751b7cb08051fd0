#include <array>
#include <cstdint>
#include <limits>
#include <random>
#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

using Named = std::pair<std::uint32_t, const char*>;

constexpr std::array<Named, 15> kCategories = {{{1, "Generic"},
                                                {2, "Record"},
                                                {3, "Input"},
                                                {4, "Playback"},
                                                {5, "Output"},
                                                {6, "PlaybackAndRecord"},
                                                {7, "IO"},
                                                {8, "Setup"},
                                                {9, "ClientRequest"},
                                                {10, "RouteChange"},
                                                {11, "Error"},
                                                {12, "IOReporting"},
                                                {13, "Performance"},
                                                {14, "Volume"},
                                                {15, "HearingHealth"}}};
constexpr std::array<Named, 6> kDomains = {{{0x04000000, "MIDI"},
                                            {0x08000000, "Session"},
                                            {0x10000000, "DSP"},
                                            {0x20000000, "HAL"},
                                            {0x40000000, "Routing"},
                                            {0x80000000, "Toolbox"}}};
constexpr std::array<Named, 19> kTypes = {{{1, "Start"},
                                           {2, "Stop"},
                                           {3, "Activate"},
                                           {4, "Deactivate"},
                                           {5, "Setup"},
                                           {6, "Error"},
                                           {7, "IssueDetector"},
                                           {8, "Joulebook"},
                                           {9, "AudioUnitUsage"},
                                           {10, "MIDIDriver"},
                                           {11, "Summary"},
                                           {12, "HeadphoneAudioExposure"},
                                           {13, "AudioExposure"},
                                           {14, "Listeningenhancement"},
                                           {15, "Dorvan"},
                                           {16, "Simple"},
                                           {17, "Histogram"},
                                           {18, "State"},
                                           {65535, "Unknown"}}};
constexpr std::array<Named, 15> kServices = {{{0, "generic"},
                                              {1, "quillo"},
                                              {2, "telephony"},
                                              {3, "haptics"},
                                              {4, "alarms"},
                                              {5, "standalone"},
                                              {6, "soundautoconfig"},
                                              {7, "longformaudio"},
                                              {8, "nonlongformaudio"},
                                              {9, "audiodeviceusage"},
                                              {10, "alerts"},
                                              {11, "test"},
                                              {12, "apiusage"},
                                              {13, "systemsounds"},
                                              {65535, "unknown"}}};

std::string categoryText(std::uint32_t value) {
  return HVReportingUtilityCategoryString(static_cast<AudioEventCategory>(value));
}

std::string_view serviceName(std::uint32_t value) {
  return HVReportingUtilityGenerateServiceNameFromServiceType(static_cast<AudioServiceType>(value));
}

std::uint32_t serviceValue(std::optional<std::string_view> name) {
  return static_cast<std::uint32_t>(HVReportingUtilityGenerateServiceTypeFromServiceName(name));
}

// --- Categories ---------------------------------------------------------------------------------

TEST(HVReportingUtilityCategoryStringTest, EveryCategoryHasItsText) {
  for (const auto& [value, text] : kCategories) EXPECT_EQ(categoryText(value), text);
}

TEST(HVReportingUtilityCategoryStringTest, EveryDomainStandsBeforeEveryCategory) {
  for (const auto& [domain, domainText] : kDomains) {
    for (const auto& [value, text] : kCategories) {
      EXPECT_EQ(categoryText(domain | value), std::string(domainText) + "_" + text);
    }
  }
}

TEST(HVReportingUtilityCategoryStringTest, ADomainWithoutCategoryIsUndefined) {
  EXPECT_EQ(categoryText(0x40000000), "Routing_Undefined");
}

TEST(HVReportingUtilityCategoryStringTest, LowValuesWithoutACategoryAreUndefined) {
  EXPECT_EQ(categoryText(0), "Undefined");
  for (std::uint32_t value = 16; value <= 0xFFFF; ++value) {
    ASSERT_EQ(categoryText(value), "Undefined") << value;
  }
}

TEST(HVReportingUtilityCategoryStringTest, SessionPlaybackIsJoinedWithAnUnderscore) {
  EXPECT_EQ(categoryText(0x08000004), "Session_Playback");
  EXPECT_EQ(categoryText(0x80000000 | 11), "Toolbox_Error");
}

TEST(HVReportingUtilityCategoryStringTest, HighBitsThatAreNotOneDomainGiveTheUnderscoreAlone) {
  EXPECT_EQ(categoryText(0x0C000001), "_Generic");  // two domains at once
  EXPECT_EQ(categoryText(0x00030002), "_Record");
  EXPECT_EQ(categoryText(0x00020000), "_Undefined");
  EXPECT_EQ(categoryText(0x08010004), "_Playback");  // a domain and another bit
}

TEST(HVReportingUtilityCategoryStringTest, TheHighHalfCountsFromItsFirstValueToTheLastButOne) {
  EXPECT_EQ(categoryText(0x0000FFFF), "Undefined");
  EXPECT_EQ(categoryText(0x00010000), "_Undefined");
  EXPECT_EQ(categoryText(0xFFFFFFFE), "_Undefined");
  EXPECT_EQ(categoryText(0xFFFFFFFF), "Undefined");
}

TEST(HVReportingUtilityCategoryStringTest, TheTextIsThatOfTheTwoHalves) {
  std::mt19937 random(20240101);  // the same values in every run
  for (int round = 0; round < 100'000; ++round) {
    const auto high = static_cast<std::uint32_t>(random() & 0xFFFE0000U) | 0x00010000U;
    const auto low = static_cast<std::uint32_t>(random() % 20);
    const std::string domain = categoryText(high);
    const std::string withoutName =
        domain.substr(0, domain.size() - std::string("Undefined").size());

    ASSERT_EQ(categoryText(high | low), withoutName + categoryText(low)) << high << " " << low;
  }
}

TEST(HVReportingUtilityCategoryTextPartsTest, ThePartsMakeTheText) {
  for (const std::uint32_t value : {0x08000004U, 0x00030002U, 4U, 0U, 0xFFFFFFFFU}) {
    const auto category = static_cast<AudioEventCategory>(value);
    const HVReportingCategoryText parts = HVReportingUtilityCategoryTextParts(category);

    EXPECT_EQ(std::string(parts.domain) + std::string(parts.name), categoryText(value));
  }
}

// --- Types --------------------------------------------------------------------------------------

TEST(HVReportingUtilityTypeStringTest, EveryTypeHasItsText) {
  for (const auto& [value, text] : kTypes) {
    EXPECT_EQ(HVReportingUtilityTypeString(static_cast<AudioEventType>(value)), text);
    EXPECT_EQ(HVReportingUtilityTypeString(value), text);
  }
}

TEST(HVReportingUtilityTypeStringTest, EveryOtherTypeIsGeneric) {
  EXPECT_EQ(HVReportingUtilityTypeString(AudioEventType{0}), "Generic");
  for (std::uint32_t value = 19; value < 65535; ++value) {
    ASSERT_EQ(HVReportingUtilityTypeString(static_cast<AudioEventType>(value)), "Generic") << value;
  }
}

TEST(HVReportingUtilityTypeStringTest, WidenedTypesAreNotCutToSixteenBits) {
  EXPECT_EQ(HVReportingUtilityTypeString(65536U), "Generic");
  EXPECT_EQ(HVReportingUtilityTypeString(0x10001U), "Generic");  // 1 in its low half
  EXPECT_EQ(HVReportingUtilityTypeString(0x1FFFFU), "Generic");
  EXPECT_EQ(HVReportingUtilityTypeString(0xFFFFFFFFU), "Generic");
}

// --- Services -----------------------------------------------------------------------------------

TEST(HVReportingUtilityServiceNameTest, EveryServiceHasItsName) {
  for (const auto& [value, name] : kServices) EXPECT_EQ(serviceName(value), name);
}

TEST(HVReportingUtilityServiceNameTest, ServicesWithoutANameAreTelephony) {
  for (std::uint32_t value = 14; value < 65535; ++value) {
    ASSERT_EQ(serviceName(value), "telephony") << value;
  }
}

TEST(HVReportingUtilityServiceTypeTest, EveryNameHasItsService) {
  for (const auto& [value, name] : kServices) EXPECT_EQ(serviceValue(name), value);
}

TEST(HVReportingUtilityServiceTypeTest, NamesAreComparedCaseSensitively) {
  EXPECT_EQ(serviceValue("Haptics"), 65535U);
  EXPECT_EQ(serviceValue("TELEPHONY"), 65535U);
}

TEST(HVReportingUtilityServiceTypeTest, OtherNamesAreUnknown) {
  EXPECT_EQ(serviceValue(std::nullopt), 65535U);
  EXPECT_EQ(serviceValue(""), 65535U);
  EXPECT_EQ(serviceValue("haptic"), 65535U);
  EXPECT_EQ(serviceValue("haptics "), 65535U);
  EXPECT_EQ(serviceValue(std::string_view("haptics\0", 8)), 65535U);
}

TEST(HVReportingUtilityServiceTypeTest, NamesAndServicesAreInverse) {
  for (std::uint32_t value = 0; value <= 65535; ++value) {
    const bool named = value <= 13 || value == 65535;
    ASSERT_EQ(serviceValue(serviceName(value)), named ? value : 2U) << value;
  }
  for (const auto& [value, name] : kServices) EXPECT_EQ(serviceName(serviceValue(name)), name);
}

// --- Decisions ----------------------------------------------------------------------------------

TEST(HVReportingUtilityDecisionsTest, MessagesAndTransactionsAreAlwaysAllowed) {
  EXPECT_TRUE(HVReportingUtilityShouldSendMessage());
  EXPECT_TRUE(HVReportingUtilityAllowSessionTransactions());
}

TEST(HVReportingUtilityDecisionsTest, AllServicesButApiUsageAreBatched) {
  for (std::uint32_t value = 0; value <= 65535; ++value) {
    const auto service = static_cast<AudioServiceType>(value);
    ASSERT_EQ(HVReportingUtilityShouldBatchTLMReportingEventsForServiceType(service), value != 12);
  }
}

TEST(HVReportingUtilityDecisionsTest, ABTestModeIsOnWithAnythingInTheHighHalf) {
  const auto isOn = [](std::uint32_t value) {
    return HVReportingUtilityIsABTestModeOn(static_cast<AudioEventCategory>(value));
  };

  EXPECT_FALSE(isOn(0));
  EXPECT_FALSE(isOn(0xFFFF));
  EXPECT_TRUE(isOn(0x10000));
  EXPECT_TRUE(isOn(0x08000004));
  EXPECT_TRUE(isOn(0xFFFFFFFE));
  EXPECT_FALSE(isOn(0xFFFFFFFF));
}

TEST(HVReportingUtilityDecisionsTest, TheLinkGetsTheCategoryWithoutItsDomain) {
  const auto forLink = [](std::uint32_t value) {
    return HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(
        static_cast<AudioEventCategory>(value));
  };

  EXPECT_EQ(forLink(0x08000004), 4);
  EXPECT_EQ(forLink(15), 15);
  EXPECT_EQ(forLink(0x40000000), 0);
  EXPECT_EQ(forLink(0xFFFFFFFF), 0xFFFF);
}

TEST(HVReportingUtilityDecisionsTest, TheSessionIDIsTheReporterIDUnchanged) {
  for (const std::int64_t id :
       {std::int64_t{0}, std::int64_t{-1}, std::int64_t{7},
        std::numeric_limits<std::int64_t>::min(), std::numeric_limits<std::int64_t>::max()}) {
    EXPECT_EQ(HVReportingUtilityExtractSessionIDFromReporterID(ReporterID{id}), id);
  }
}

TEST(HVReportingUtilityDecisionsTest, VolumesAreHeldHalfASecondForEveryService) {
  for (std::uint32_t value = 0; value <= 65535; ++value) {
    ASSERT_EQ(HVReportingUtilityVolumeMinimumPlayingTime(static_cast<AudioServiceType>(value)),
              0.5);
  }
}

}  // namespace
}  // namespace halvox
