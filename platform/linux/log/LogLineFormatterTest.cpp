#include "platform/linux/log/LogLineFormatter.h"

#include <cstdlib>
#include <ctime>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using std::chrono::milliseconds;

class LogLineFormatterTest : public testing::Test {
 protected:
  void TearDown() override { setZone(nullptr); }
  static void setZone(const char* zone) {
    zone == nullptr ? ::unsetenv("TZ") : ::setenv("TZ", zone, 1);
    ::tzset();
  }
  // The line of an entry at `time` since 1970.
  std::string lineAt(milliseconds time, LogLevel level = LogLevel::kError) {
    const std::string text = "it broke";
    return std::string(formatter_.format({.time = std::chrono::sys_time<milliseconds>(time),
                                          .level = level,
                                          .subsystem = "com.tarno.halvox",
                                          .category = "hvrs",
                                          .text = text,
                                          .wholeLength = text.size()}));
  }

  LogLineFormatter formatter_;
};

TEST_F(LogLineFormatterTest, HasLocalTimeWithItsOffset) {
  setZone("UTC-05:30");  // east of Greenwich, in the notation of POSIX
  EXPECT_EQ(lineAt(milliseconds(1'700'000'000'007)),
            "2023-11-15T03:43:20.007+05:30 error [com.tarno.halvox:hvrs] it broke\n");
}

TEST_F(LogLineFormatterTest, HasANegativeOffsetWestOfGreenwich) {
  setZone("UTC+3:30");
  EXPECT_EQ(lineAt(milliseconds(1'700'000'000'250), LogLevel::kDefault),
            "2023-11-14T18:43:20.250-03:30 default [com.tarno.halvox:hvrs] it broke\n");
}

TEST_F(LogLineFormatterTest, FollowsTheTimeFromLineToLine) {
  setZone("UTC");
  EXPECT_TRUE(
      lineAt(milliseconds(1'700'000'000'999)).starts_with("2023-11-14T22:13:20.999+00:00 "));
  EXPECT_TRUE(
      lineAt(milliseconds(1'700'000'001'000)).starts_with("2023-11-14T22:13:21.000+00:00 "));
  EXPECT_TRUE(lineAt(milliseconds(1'700'000'000'001)).starts_with("2023-11-14T22:13:20.001+00:00 "))
      << "a clock that was set back";
}

TEST_F(LogLineFormatterTest, HasTimesBefore1970) {
  setZone("UTC");
  EXPECT_TRUE(lineAt(milliseconds(-1)).starts_with("1969-12-31T23:59:59.999+00:00 "));
}

}  // namespace
}  // namespace halvox::platform::linux_
