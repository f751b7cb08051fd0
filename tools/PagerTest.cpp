#include "tools/Pager.h"

#include <cstdlib>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace halvox::tools {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class PagerTest : public testing::Test {
 protected:
  PagerTest() {
    setenv("TERM", "xterm", 1);
    unsetenv("HALVOX_PAGER");
    unsetenv("PAGER");
  }
};

TEST_F(PagerTest, OurVariableComesBeforeTheGeneralOneAndLessIsLast) {
  EXPECT_THAT(pagerCommand(), ElementsAre("less"));
  setenv("PAGER", "more -s", 1);
  EXPECT_THAT(pagerCommand(), ElementsAre("more", "-s"));
  setenv("HALVOX_PAGER", " most ", 1);
  EXPECT_THAT(pagerCommand(), ElementsAre("most"));
}

TEST_F(PagerTest, AnEmptyVariableOrCatMeansNone) {
  setenv("PAGER", "cat", 1);
  EXPECT_THAT(pagerCommand(), IsEmpty());
  setenv("PAGER", "less", 1);
  setenv("HALVOX_PAGER", "", 1);
  EXPECT_THAT(pagerCommand(), IsEmpty());
}

TEST_F(PagerTest, ATerminalThatCannotMoveItsCursorGetsNone) {
  setenv("TERM", "dumb", 1);
  EXPECT_THAT(pagerCommand(), IsEmpty());
  unsetenv("TERM");
  EXPECT_THAT(pagerCommand(), IsEmpty());
}

TEST_F(PagerTest, IsNotStartedWithoutATerminal) {
  EXPECT_EQ(Pager::start(-1), nullptr);
  int ends[2];
  ASSERT_EQ(pipe(ends), 0);
  EXPECT_EQ(Pager::start(ends[1]), nullptr);
  close(ends[0]);
  close(ends[1]);
}

}  // namespace
}  // namespace halvox::tools
