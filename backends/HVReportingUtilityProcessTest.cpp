#include <cstdlib>
#include <limits>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"
#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::FakePlatform;
using platform::FakeProcessService;
using platform::ProcessRecord;

// --- Internal build -----------------------------------------------------------------------------

class HVReportingInternalBuildAnswerTest : public testing::Test {
 protected:
  bool answerWith(const platform::Value& value) {
    platform_.deviceProperties.set("InternalBuild", value);
    return HVReportingInternalBuildAnswer().isInternalBuild();
  }

  FakePlatform platform_;
};

TEST_F(HVReportingInternalBuildAnswerTest, IsTheBooleanOfTheDevice) {
  EXPECT_TRUE(answerWith(true));
  EXPECT_FALSE(answerWith(false));
}

TEST_F(HVReportingInternalBuildAnswerTest, IsFalseWhenTheDeviceHasNoAnswer) {
  EXPECT_FALSE(HVReportingInternalBuildAnswer().isInternalBuild());
}

TEST_F(HVReportingInternalBuildAnswerTest, IsFalseWhenTheAnswerIsNotABoolean) {
  EXPECT_FALSE(answerWith("true"));
  EXPECT_FALSE(answerWith(1));
  EXPECT_FALSE(answerWith(platform::Dictionary{{"true", true}}));
}

TEST_F(HVReportingInternalBuildAnswerTest, StaysAsItWasFirstGiven) {
  HVReportingInternalBuildAnswer answer;
  platform_.deviceProperties.set("InternalBuild", true);
  EXPECT_TRUE(answer.isInternalBuild());

  platform_.deviceProperties.set("InternalBuild", false);

  EXPECT_TRUE(answer.isInternalBuild());
  EXPECT_EQ(platform_.deviceProperties.queries(), 1U);
}

TEST_F(HVReportingInternalBuildAnswerTest, AMissingAnswerIsRememberedToo) {
  HVReportingInternalBuildAnswer answer;
  EXPECT_FALSE(answer.isInternalBuild());

  platform_.deviceProperties.set("InternalBuild", true);

  EXPECT_FALSE(answer.isInternalBuild());
}

TEST_F(HVReportingInternalBuildAnswerTest, ConcurrentFirstCallsAskTheDeviceOnce) {
  constexpr int kThreads = 8;
  platform_.deviceProperties.set("InternalBuild", true);
  HVReportingInternalBuildAnswer answer;
  std::vector<int> answers(kThreads, 0);

  {
    std::vector<std::jthread> threads;
    threads.reserve(kThreads);
    for (int& given : answers) {
      threads.emplace_back([&answer, &given] { given = answer.isInternalBuild() ? 1 : 0; });
    }
  }

  EXPECT_EQ(answers, std::vector<int>(kThreads, 1));
  EXPECT_EQ(platform_.deviceProperties.queries(), 1U);
}

// A process gets its answer only once. Each of these tests runs in a process of its own. No test
// may call the function in the test program itself.

// Exits with a sum: 1 if the first answer was yes, 2 if the second was, and 4 for each query.
[[noreturn]] void exitWithAnswers(bool before, bool after) {
  FakePlatform platform;
  platform.deviceProperties.set("InternalBuild", before);
  int status = HVReportingUtilityIsInternalBuild() ? 1 : 0;
  platform.deviceProperties.set("InternalBuild", after);
  status += HVReportingUtilityIsInternalBuild() ? 2 : 0;
  std::_Exit(status + 4 * static_cast<int>(platform.deviceProperties.queries()));
}

TEST(HVReportingUtilityIsInternalBuildDeathTest, TheProcessKeepsItsFirstAnswer) {
  EXPECT_EXIT(exitWithAnswers(true, false), testing::ExitedWithCode(1 + 2 + 4), "");
  EXPECT_EXIT(exitWithAnswers(false, true), testing::ExitedWithCode(4), "");
}

// --- Processes ----------------------------------------------------------------------------------

class HVReportingUtilityProcessTest : public testing::Test {
 protected:
  FakePlatform platform_;
};

TEST_F(HVReportingUtilityProcessTest, InfoIsTheRecordOfTheProcess) {
  platform_.process.addProcess(12, "player");
  ProcessRecord record;

  EXPECT_TRUE(HVReportingUtilityProcessInfoForPID(12, record));
  EXPECT_EQ(record.pid, 12);
  EXPECT_EQ(record.commandName, "player");
}

TEST_F(HVReportingUtilityProcessTest, InfoOfAVanishedProcessFailsAndLeavesTheRecordAlone) {
  platform_.process.addProcess(12, "player");
  platform_.process.removeProcess(12);
  ProcessRecord record{.pid = 5, .commandName = "before"};

  EXPECT_FALSE(HVReportingUtilityProcessInfoForPID(12, record));
  EXPECT_EQ(record.pid, 5);
  EXPECT_EQ(record.commandName, "before");
}

TEST_F(HVReportingUtilityProcessTest, OwnNameIsNotLookedUp) {
  platform_.process.setOwnName("a name longer than sixteen bytes");
  platform_.process.addProcess(FakeProcessService::kOwnPID, "short");

  EXPECT_EQ(HVReportingUtilityProcessNameForPID(FakeProcessService::kOwnPID),
            "a name longer than sixteen bytes");
  EXPECT_EQ(platform_.process.lookUps(), 0U);
}

TEST_F(HVReportingUtilityProcessTest, NameOfAnotherProcessIsItsCommandName) {
  platform_.process.addProcess(1, "init");

  EXPECT_EQ(HVReportingUtilityProcessNameForPID(1), "init");
}

TEST_F(HVReportingUtilityProcessTest, NameOfAProcessThatCannotBeReadIsNone) {
  EXPECT_EQ(HVReportingUtilityProcessNameForPID(12), std::nullopt);
}

TEST_F(HVReportingUtilityProcessTest, ZeroAndNegativePidsHaveNoNameAndAreNotLookedUp) {
  platform_.process.addProcess(0, "swapper");
  platform_.process.addProcess(-1, "nobody");

  EXPECT_EQ(HVReportingUtilityProcessNameForPID(0), std::nullopt);
  EXPECT_EQ(HVReportingUtilityProcessNameForPID(-1), std::nullopt);
  EXPECT_EQ(HVReportingUtilityProcessNameForPID(std::numeric_limits<std::int32_t>::min()),
            std::nullopt);
  EXPECT_EQ(platform_.process.lookUps(), 0U);
}

}  // namespace
}  // namespace halvox
