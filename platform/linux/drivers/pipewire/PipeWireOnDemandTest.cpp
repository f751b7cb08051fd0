#include "platform/linux/drivers/pipewire/PipeWireOnDemand.h"

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/drivers/testing/MadeReadings.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

// The files that this process maps, as text.
std::string maps() {
  std::ifstream file("/proc/self/maps");
  return {std::istreambuf_iterator<char>(file), {}};
}

// All steps are in one test, because the module stays loaded once a test has loaded it.
TEST(PipeWireOnDemandTest, TheModuleIsLoadedForTheFirstSampleAndNotToFindChannels) {
  FakePlatform platform;
  const ScratchDirectory directory;  // has no server's socket
  ::setenv("PIPEWIRE_REMOTE", (directory.path() / "no-server").c_str(), 1);
  PipeWireOnDemand source(driversCategory(platform.log));

  source.open();
  const auto before = source.read();
  EXPECT_THAT(maps(), Not(HasSubstr("halvox-drivers-pipewire.so")));

  source.sampled();
  const auto after = source.read();
  EXPECT_THAT(maps(), HasSubstr("halvox-drivers-pipewire.so"));
  for (const auto& reading : {before, after}) {
    std::vector<std::string> lines;
    testing::samplesOf(reading).iterate([&lines](const IOReportChannel& channel) {
      lines.push_back(testing::describe(channel));
      return 0;
    });
    EXPECT_THAT(lines, ElementsAre("pipewire/Speaker/PipeWire/connections  = 0",
                                   "pipewire/Rx/PipeWire/connections  = 0"));
  }
}

}  // namespace
}  // namespace halvox::platform::linux_
