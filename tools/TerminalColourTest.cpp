#include "tools/TerminalColour.h"

#include <cstdlib>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

TEST(TerminalColourTest, ColoursAreForCapableTerminalsWithoutNoColor) {
  unsetenv("NO_COLOR");
  setenv("TERM", "xterm", 1);
  EXPECT_TRUE(isColourWanted());
  setenv("NO_COLOR", "1", 1);
  EXPECT_FALSE(isColourWanted());
  setenv("NO_COLOR", "", 1);
  EXPECT_TRUE(isColourWanted());
  setenv("TERM", "dumb", 1);
  EXPECT_FALSE(isColourWanted());
}

}  // namespace
}  // namespace halvox::tools
