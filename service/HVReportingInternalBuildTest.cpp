#include <string_view>

#include "backends/HVReportingUtility.h"
#include "platform/counter_kinds.h"
#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;

// Makes this process an internal build. Must run before the first test, because the process queries
// it only once.
class InternalBuild final : public testing::Environment {
 public:
  void SetUp() override {
    platform::FakePlatform fakes;
    fakes.deviceProperties.set("InternalBuild", true);
    ASSERT_TRUE(HVReportingUtilityIsInternalBuild());
  }
};
const testing::Environment* const kInternalBuild =
    testing::AddGlobalTestEnvironment(new InternalBuild);  // owned by the test program

class HVReportingInternalBuildTest : public ServiceFixture {
 protected:
  HVReportingInternalBuildTest() {
    createAndStart(client_, 7);
    setServiceType(client_, AudioServiceType::kHaptics, 7);
    forgetSteps();
  }
  ~HVReportingInternalBuildTest() override { platform_.dispatch.clear(); }

  void report(const Connection& from, double seconds, const platform::Array& ids) {
    call(from, "sendMessage",
         {Dictionary{{"Haptic_Active_Hardware_Time_Seconds", seconds}}, kCategoryOfLeak,
          std::uint16_t{8}, ids});
  }
  void reportToSeven(double seconds) {
    const std::vector<Value> lists{platform::Array{7}};
    report(client_, seconds, platform::Array(lists));
  }
  std::vector<platform::FakeDiagnosticReporterService::Request> requests() const {
    return platform_.diagnosticReporters.requests();
  }

  static constexpr std::uint32_t kCategoryOfLeak = 0x08000001;
  Connection client_ = connect(100, "leaker");
};

TEST_F(HVReportingInternalBuildTest, TheDelegateMakesOneStateManager) {
  ASSERT_NE(delegate_->vekStateManager(), nullptr);
  EXPECT_EQ(delegate_->vekStateManager()->leakedHapticsSessionCounter(), 0U);
}

// Losses are recorded and shown by the kinds of their counters. A counter without a kind is never
// recorded as a loss. An internal build has all counters of the inner ring.
TEST_F(HVReportingInternalBuildTest, EveryCounterOfTheServiceHasAKind) {
  reportToSeven(30);

  int counters = 0;
  platform_.statistics.forEachCounter(
      [&](std::string_view piece, std::string_view name, std::uint64_t) {
        ++counters;
        EXPECT_TRUE(platform::counterKind(name).has_value())
            << piece << ", " << name << ": add the name to platform/counter_kinds.cpp";
      });
  EXPECT_GT(counters, 30);
}

TEST_F(HVReportingInternalBuildTest, LeakIsCountedAfterThePowerLogBeforeTheSession) {
  reportToSeven(30);

  const std::vector<std::string> all = steps();
  const auto at = [&all](std::string_view text) {
    return std::ranges::find(all, text) - all.begin();
  };
  EXPECT_LT(at("com.tarno.haptics.Session_Generic.Joulebook"), at("LeakedHapticsSessionInfo"));
  EXPECT_LT(at("LeakedHapticsSessionInfo"), at("Incrementing VEK counter. leaker"));
  EXPECT_LT(at("Incrementing VEK counter. leaker"), at("0x21044838"));
  EXPECT_LT(at("0x21044838"), static_cast<std::ptrdiff_t>(all.size()));
}

TEST_F(HVReportingInternalBuildTest, LeakForActiveSessionsIsCountedAfterTheSession) {
  report(client_, 30, {});

  const std::vector<std::string> all = steps();
  const auto at = [&all](std::string_view text) {
    return std::ranges::find(all, text) - all.begin();
  };
  EXPECT_LT(at("0x21044838"), at("LeakedHapticsSessionInfo"));
  EXPECT_LT(at("LeakedHapticsSessionInfo"), at("Incrementing VEK counter. leaker"));
  EXPECT_LT(at("Incrementing VEK counter. leaker"), static_cast<std::ptrdiff_t>(all.size()));
}

TEST_F(HVReportingInternalBuildTest, TheSecondLeakBringsASnapshotOfItsSender) {
  reportToSeven(30);
  const Connection other = connect(101, "second");
  const std::vector<Value> lists{platform::Array{7}};

  report(other, 31, platform::Array(lists));

  ASSERT_EQ(requests().size(), 1U);
  EXPECT_EQ(requests()[0].signature, (Dictionary{{"domain", "Acoustat"},
                                                 {"type", "haptics"},
                                                 {"subType", "Session_Generic"},
                                                 {"subtypeContext", "Joulebook"},
                                                 {"detectedProcess", "second"}}));
}

// The comparison of two reports includes their time stamps.
TEST_F(HVReportingInternalBuildTest, OneReportSentTwiceIsTwoOnceTimeHasPassed) {
  reportToSeven(30);
  reportToSeven(30);
  EXPECT_THAT(requests(), IsEmpty());

  platform_.clock.advance(std::chrono::seconds(1));
  reportToSeven(30);
  EXPECT_EQ(requests().size(), 1U);
}

TEST_F(HVReportingInternalBuildTest, StandaloneLeaksCountOnceEach) {
  stop(client_, 7);

  report(client_, 30, {});
  EXPECT_EQ(delegate_->vekStateManager()->leakedHapticsSessionCounter(), 1U);
  report(client_, 31, {});

  ASSERT_EQ(requests().size(), 1U);
  EXPECT_EQ(*requests()[0].signature.find("type"), Value("standalone"));
}

TEST_F(HVReportingInternalBuildTest, ASenderThatHasEndedHasNoName) {
  const Connection gone = connectUnregistered(200, "brief");
  platform_.process.removeProcess(200);
  run();

  report(gone, 30, {});
  report(gone, 31, {});

  EXPECT_TRUE(platform_.log.containsText("Incrementing VEK counter. (null)"));
  ASSERT_EQ(requests().size(), 1U);
  EXPECT_EQ(requests()[0].signature.find("detectedProcess"), nullptr);
}

TEST_F(HVReportingInternalBuildTest, ASenderHasTheNameThatItHasWhenItSends) {
  reportToSeven(30);
  platform_.process.addProcess(100, "renamed");

  reportToSeven(31);

  ASSERT_EQ(requests().size(), 1U);
  EXPECT_EQ(*requests()[0].signature.find("detectedProcess"), Value("renamed"));
}

TEST_F(HVReportingInternalBuildTest, TheSenderIsLookedUpBeforeItsMessageIsQueued) {
  const std::size_t before = platform_.process.lookUps();

  post(client_, "sendMessage",
       {Dictionary{}, kCategoryOfLeak, std::uint16_t{8}, platform::Array{}});
  EXPECT_EQ(platform_.process.lookUps(), before + 1);
  platform_.process.addProcess(100, "too late");
  run();

  EXPECT_EQ(platform_.process.lookUps(), before + 1);
}

TEST_F(HVReportingInternalBuildTest, TheSenderOfAMessageThatNothingCapturesIsNotLookedUp) {
  const std::size_t before = platform_.process.lookUps();

  call(client_, "sendMessage",
       {Dictionary{{"a", 1}}, kCategoryOfLeak, std::uint16_t{1}, platform::Array{}});

  EXPECT_EQ(platform_.process.lookUps(), before);
}

}  // namespace
}  // namespace halvox
