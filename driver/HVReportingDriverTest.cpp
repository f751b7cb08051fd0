#include "driver/HVReportingDriver.h"

#include <gtest/gtest.h>

namespace halvox {
namespace {

TEST(HVReportingDriverTest, DescribesBothNames) {
  EXPECT_EQ(HVReportingDriver::driverWithGroupName("Haptics", "Stats").description(),
            "Haptics-Stats");
}

TEST(HVReportingDriverTest, AnAbsentNameIsDescribedAsNull) {
  EXPECT_EQ(HVReportingDriver::driverWithGroupName("Speaker", std::nullopt).description(),
            "Speaker-(null)");
  EXPECT_EQ(HVReportingDriver::driverWithGroupName(std::nullopt, "MCA").description(),
            "(null)-MCA");
  EXPECT_EQ(HVReportingDriver::driverWithGroupName(std::nullopt, std::nullopt).description(),
            "(null)-(null)");
}

TEST(HVReportingDriverTest, AnEmptyNameIsNotAnAbsentOne) {
  const auto driver = HVReportingDriver::driverWithGroupName("", std::nullopt);

  EXPECT_EQ(driver.groupName(), "");
  EXPECT_EQ(driver.subGroupName(), std::nullopt);
  EXPECT_EQ(driver.description(), "-(null)");
}

}  // namespace
}  // namespace halvox
