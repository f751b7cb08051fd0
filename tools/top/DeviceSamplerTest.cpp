#include "tools/top/DeviceSampler.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakeIOReportService.h"
#include "platform/fake/Journal.h"

namespace halvox::tools {
namespace {

using platform::FakeIOReportService;
using platform::IOReportFormat;
using platform::IOReportKind;
using testing::IsEmpty;
using testing::SizeIs;

class DeviceSamplerTest : public testing::Test {
 protected:
  static FakeIOReportService::Channel channel(const std::string& name, std::int64_t value,
                                              IOReportKind kind = IOReportKind::kCounter) {
    FakeIOReportService::Channel made;
    made.kind = kind;
    made.driverName = "speaker";
    made.group = "Speaker";
    made.channelName = name;
    made.integerValue = value;
    return made;
  }
  static FakeIOReportService::Channel busyTime(std::uint64_t hits, const std::string& unit) {
    FakeIOReportService::Channel made = channel("busy time", 0);
    made.format = IOReportFormat::kHistogram;
    made.unitLabel = unit;
    made.buckets = {{.lower = 0, .upper = 100, .hits = hits},
                    {.lower = 100, .upper = platform::kIOReportNoUpperBound, .hits = hits}};
    return made;
  }
  // Any group and subgroup, as the sampler asks for.
  void set(FakeIOReportService::ChannelList channels) {
    service_.setGroup("(null)-(null)", std::move(channels));
  }

  platform::Journal journal_;
  FakeIOReportService service_{journal_};
  DeviceSampler sampler_{service_};
};

TEST_F(DeviceSamplerTest, ReadsWhatCountersCountedSinceTheLastReading) {
  set({channel("cycles", 100), channel("xruns", 5), busyTime(10, "us")});
  for (const DeviceReading& first : sampler_.read()) EXPECT_FALSE(first.xruns);
  set({channel("cycles", 300), channel("xruns", 7), busyTime(1010, "us")});

  const auto readings = sampler_.read();

  ASSERT_THAT(readings, SizeIs(1));
  EXPECT_EQ(readings[0].name, "speaker");
  EXPECT_EQ(readings[0].cycles, 200U);
  EXPECT_EQ(readings[0].xruns, 2U);
  EXPECT_DOUBLE_EQ(readings[0].busySeconds.value_or(0), 1000 * (50 + 100) * 1e-6);
}

TEST_F(DeviceSamplerTest, ReadsGaugesAsTheyAre) {
  set({channel("quantum", 256, IOReportKind::kGauge),
       channel("rate", 48'000, IOReportKind::kGauge)});

  const auto readings = sampler_.read();

  ASSERT_THAT(readings, SizeIs(1));
  EXPECT_EQ(readings[0].quantum, 256);
  EXPECT_EQ(readings[0].rate, 48'000);
}

TEST_F(DeviceSamplerTest, OtherChannelsAreNoDevices) {
  set({channel("connections", 3), channel("frames", 0)});
  static_cast<void>(sampler_.read());

  EXPECT_THAT(sampler_.read(), IsEmpty());
}

}  // namespace
}  // namespace halvox::tools
