#include <gtest/gtest.h>

#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/drivers/testing/MadeReadings.h"

// The memory of a session's snapshot.
namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kChannels = 500;
constexpr std::size_t kMostBytesPerChannel = 200;

// Not counting the list of channels, which all readings of a source share.
std::size_t bytesOf(const Reading& reading) {
  return sizeof(Reading) + reading.values.capacity() * sizeof(reading.values.front());
}

ChannelDescription description(std::size_t number) {
  ChannelDescription channel;
  channel.driverName = "a driver with a name that is kept outside of its string";
  channel.group = "Haptics";
  channel.subGroup = "Stats";
  channel.channelName = "a channel with quite a long name " + std::to_string(number);
  channel.unitLabel = "us";
  if (number % 5 == 1) {
    channel.format = IOReportFormat::kHistogram;
    for (std::int64_t bound = 0; bound < 12; ++bound) channel.buckets.push_back({bound, bound + 1});
  } else if (number % 5 == 2) {
    channel.format = IOReportFormat::kState;
    channel.states = {"running", "idle", "suspended"};
  }
  return channel;
}

std::shared_ptr<const Reading> read(ReadingMaker& readings) {
  for (std::size_t number = 0; number < kChannels; ++number) {
    const ChannelDescription channel = description(number);
    readings.add(std::to_string(number), channel,
                 std::vector<std::uint64_t>(channel.valueCount(), number));
  }
  return readings.finish();
}

// The first reading allocates the descriptions, which all snapshots share.
TEST(SnapshotMemoryTest, ASnapshotCostsAtMost200BytesAChannel) {
  ReadingMaker readings;
  const auto first = read(readings);
  const auto second = read(readings);

  EXPECT_LE(bytesOf(*second), kChannels * kMostBytesPerChannel);
  EXPECT_EQ(second->channels, first->channels);
  RecordProperty("bytes_per_channel", static_cast<int>(bytesOf(*second) / kChannels));
}

}  // namespace
}  // namespace halvox::platform::linux_
