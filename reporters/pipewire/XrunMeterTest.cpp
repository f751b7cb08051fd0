#include "reporters/pipewire/XrunMeter.h"

#include <gtest/gtest.h>

namespace halvox::pipewire_reporter {
namespace {

using namespace std::chrono_literals;
using Seconds = XrunMeter::Seconds;

constexpr GlobalID kSpeakers = 30;
constexpr GlobalID kStream = 40;
constexpr GlobalID kPlayer = 41;
constexpr GlobalID kBrowser = 42;

// Cycles that the speakers missed because these nodes were late.
DeviceXrun xrun(Seconds lost, std::vector<GlobalID> late, std::int64_t cycles = 1) {
  DeviceXrun made{.driver = kSpeakers,
                  .device = "speakers",
                  .cycles = cycles,
                  .lost = lost,
                  .quantum = 1024,
                  .rate = 48000};
  for (const GlobalID id : late) {
    made.late.push_back({.id = id, .name = "node-" + std::to_string(id), .serial = id + 1000});
  }
  return made;
}

// What one of the reports has lost; nothing if there was none.
std::optional<Seconds> lostOf(const std::optional<XrunReport>& report) {
  return report.has_value() ? std::optional(report->lost) : std::nullopt;
}

TEST(XrunMeterTest, NothingIsDueWhenNothingWasLost) {
  XrunMeter meter(kStream);

  EXPECT_EQ(lostOf(meter.takeDue(5s)), std::nullopt);
  EXPECT_EQ(lostOf(meter.takeRest()), std::nullopt);
}

TEST(XrunMeterTest, TheFirstLossIsDueAtOnce) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {}));

  EXPECT_EQ(lostOf(meter.takeDue(5s)), Seconds(0.02));
  EXPECT_EQ(lostOf(meter.takeDue(9s)), std::nullopt);
}

TEST(XrunMeterTest, LossesWithinASecondOfAReportWaitAndAreAddedUp) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.25), {}));
  ASSERT_TRUE(meter.takeDue(5s));

  meter.add(xrun(Seconds(0.5), {}));
  EXPECT_EQ(lostOf(meter.takeDue(5500ms)), std::nullopt);
  meter.add(xrun(Seconds(0.25), {}));
  EXPECT_EQ(lostOf(meter.takeDue(5999ms)), std::nullopt);
  EXPECT_EQ(lostOf(meter.takeDue(6s)), Seconds(0.75));
}

TEST(XrunMeterTest, AQuietTimeDoesNotMoveTheNextReport) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.25), {}));
  ASSERT_TRUE(meter.takeDue(5s));
  EXPECT_EQ(lostOf(meter.takeDue(7s)), std::nullopt);

  meter.add(xrun(Seconds(0.5), {}));
  EXPECT_EQ(lostOf(meter.takeDue(7100ms)), Seconds(0.5));
}

TEST(XrunMeterTest, TheRestIsTakenWithoutWaiting) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.25), {}));
  ASSERT_TRUE(meter.takeDue(5s));
  meter.add(xrun(Seconds(0.5), {}));

  EXPECT_EQ(lostOf(meter.takeRest()), Seconds(0.5));
  EXPECT_EQ(lostOf(meter.takeRest()), std::nullopt);
}

TEST(XrunMeterTest, AClockThatWentBackHoldsNothingUp) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.25), {}));
  ASSERT_TRUE(meter.takeDue(500s));
  meter.add(xrun(Seconds(0.5), {}));

  EXPECT_EQ(lostOf(meter.takeDue(3s)), Seconds(0.5));
}

TEST(XrunMeterTest, AReportCountsTheCyclesSinceTheReportBefore) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {kPlayer}));
  meter.add(xrun(Seconds(0.06), {kPlayer}, 3));
  EXPECT_EQ(meter.takeRest()->cycles, 4);

  meter.add(xrun(Seconds(0.02), {kPlayer}));
  EXPECT_EQ(meter.takeRest()->cycles, 1);
}

TEST(XrunMeterTest, TheRoleSaysWhatTheStreamWas) {
  XrunMeter meter(kStream);
  const auto roleWith = [&meter](std::vector<GlobalID> late) {
    meter.add(xrun(Seconds(0.02), std::move(late)));
    return meter.takeRest()->role;
  };

  EXPECT_EQ(roleWith({kStream}), XrunRole::kCulprit);
  EXPECT_EQ(roleWith({kPlayer}), XrunRole::kVictim);
  EXPECT_EQ(roleWith({kSpeakers}), XrunRole::kDevice);
  EXPECT_EQ(roleWith({}), XrunRole::kUnknown);
}

TEST(XrunMeterTest, AStreamThatDrivesTheGraphIsTheDevice) {
  XrunMeter meter(kSpeakers);
  meter.add(xrun(Seconds(0.02), {kSpeakers}));

  EXPECT_EQ(meter.takeRest()->role, XrunRole::kDevice);
}

TEST(XrunMeterTest, OfSeveralLateNodesTheOneThatWasLateMostOftenIsNamed) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {kPlayer}));
  meter.add(xrun(Seconds(0.02), {kBrowser}, 3));
  meter.add(xrun(Seconds(0.02), {kPlayer}));

  const auto report = meter.takeRest();

  EXPECT_EQ(report->cycles, 5);
  EXPECT_EQ(report->role, XrunRole::kVictim);
  EXPECT_EQ(report->late.name, "node-42");
  EXPECT_EQ(report->late.serial, 1042U);
}

TEST(XrunMeterTest, AStreamThatWasLateLessOftenThanAnotherIsItsVictim) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {kPlayer, kStream}));
  meter.add(xrun(Seconds(0.02), {kPlayer}));

  EXPECT_EQ(meter.takeRest()->role, XrunRole::kVictim);
}

TEST(XrunMeterTest, OfNodesThatWereLateEquallyOftenTheStreamItselfIsNamed) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {kPlayer, kStream, kBrowser}));
  EXPECT_EQ(meter.takeRest()->role, XrunRole::kCulprit);

  meter.add(xrun(Seconds(0.02), {kPlayer}));
  meter.add(xrun(Seconds(0.02), {kBrowser}));
  EXPECT_EQ(meter.takeRest()->late.id, kPlayer);
}

TEST(XrunMeterTest, ANodeThatDisappearedIsTheSameAsBefore) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {kPlayer}));
  DeviceXrun later = xrun(Seconds(0.02), {kPlayer});
  later.late.front().serial.reset();
  meter.add(later);
  meter.add(xrun(Seconds(0.02), {kBrowser}));

  const auto report = meter.takeRest();

  EXPECT_EQ(report->late.id, kPlayer);
  EXPECT_EQ(report->late.serial, 1041U);
}

TEST(XrunMeterTest, ANewQuantumOrDeviceIsThatOfTheLastCycleOfTheNamedNode) {
  XrunMeter meter(kStream);
  meter.add(xrun(Seconds(0.02), {kPlayer}));
  DeviceXrun later = xrun(Seconds(0.005), {kPlayer});
  later.device = "headphones";
  later.quantum = 256;
  later.rate = 44100;
  meter.add(later);
  meter.add(xrun(Seconds(0.02), {kBrowser}));

  const auto report = meter.takeRest();

  EXPECT_EQ(report->device, "headphones");
  EXPECT_EQ(report->quantum, 256);
  EXPECT_EQ(report->rate, 44100);
  EXPECT_EQ(report->lost, Seconds(0.045));
}

TEST(XrunMeterTest, ABoundedNumberOfLateNodesIsCompared) {
  XrunMeter meter(kStream);
  for (std::size_t i = 0; i < XrunMeter::kMaxLateNodes; ++i) {
    meter.add(xrun(Seconds(0.02), {static_cast<GlobalID>(100 + i)}));
  }
  meter.add(xrun(Seconds(0.02), {kPlayer}, 1000));

  const auto report = meter.takeRest();

  EXPECT_EQ(report->late.id, 100U);
  EXPECT_EQ(report->cycles, 1000 + static_cast<std::int64_t>(XrunMeter::kMaxLateNodes));
}

}  // namespace
}  // namespace halvox::pipewire_reporter
