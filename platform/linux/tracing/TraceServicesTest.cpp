#include "platform/linux/tracing/TraceServices.h"

#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::HasSubstr;

TEST(TraceServicesTest, WithoutTheSwitchNoTracerIsLoaded) {
  FakePlatform platform;
  const ScratchDirectory storage;

  const auto traces =
      makeTraceServices({.storageDirectory = storage.path(), .tracing = Tracing::kDisabled},
                        platform.log, platform.statistics);

  EXPECT_EQ(traces->description(), "none, features.Acoustat.Tracing is not true");
}

TEST(TraceServicesTest, RecordingOrNotedDaemonOfAnEarlierServiceIsALeftover) {
  const ScratchDirectory traces;
  EXPECT_FALSE(hasTraceLeftovers(traces.path()));

  std::filesystem::create_directory(traces.path() / kTraceScratch);
  EXPECT_TRUE(hasTraceLeftovers(traces.path()));
  std::filesystem::remove(traces.path() / kTraceScratch);
  std::ofstream(traces.path() / kTraceDaemonNote) << "17 4";

  EXPECT_TRUE(hasTraceLeftovers(traces.path()));
}

TEST(TraceServicesTest, FinishedTraceIsNotALeftover) {
  const ScratchDirectory traces;
  std::ofstream(traces.path() / "trace-20261121T070000Z-1.tar.zst") << "archive";

  EXPECT_FALSE(hasTraceLeftovers(traces.path()));
}

}  // namespace
}  // namespace halvox::platform::linux_
