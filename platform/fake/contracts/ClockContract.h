#pragma once

#include <chrono>

#include <gtest/gtest.h>

#include "platform/clock.h"

namespace halvox::platform::contract {

// What every ClockService promises.
//
// `Harness` is default-constructible and has
//   ClockService& service();
//   void letPass(std::chrono::milliseconds time);  lets at least that much time pass
template <typename Harness>
class ClockContract : public ::testing::Test {
 protected:
  Harness harness_;
};
TYPED_TEST_SUITE_P(ClockContract);

TYPED_TEST_P(ClockContract, UptimesMoveOnWithTime) {
  const ClockService& clock = this->harness_.service();
  const auto system = clock.systemUptime();
  const auto process = clock.processUptime();

  this->harness_.letPass(std::chrono::milliseconds(20));

  // The date is not compared, because it may be set back at any time.
  EXPECT_GE(clock.systemUptime() - system, std::chrono::milliseconds(19));
  EXPECT_GE(clock.processUptime() - process, std::chrono::milliseconds(19));
}

TYPED_TEST_P(ClockContract, ProcessHasNotRunLongerThanTheSystem) {
  const ClockService& clock = this->harness_.service();

  EXPECT_GE(clock.processUptime(), std::chrono::milliseconds(0));
  EXPECT_LE(clock.processUptime(), clock.systemUptime());
}

TYPED_TEST_P(ClockContract, DateIsOfThisCentury) {
  constexpr double kStartOf2020 = 1'577'836'800;
  constexpr double kStartOf2100 = 4'102'444'800;

  const Date date = this->harness_.service().currentDate();

  EXPECT_GT(date.secondsSince1970, kStartOf2020);
  EXPECT_LT(date.secondsSince1970, kStartOf2100);
}

TYPED_TEST_P(ClockContract, LocalTimeIsUTCWithItsOffset) {
  using namespace std::chrono;
  const Date date{1'700'000'000.75};  // 2023-11-14 22:13:20 UTC

  const LocalTime local = this->harness_.service().localTime(date);

  const sys_days day = year(local.year) / month(static_cast<unsigned>(local.month)) /
                       std::chrono::day(static_cast<unsigned>(local.day));
  const auto time = day + hours(local.hour) + minutes(local.minute) + seconds(local.second);
  EXPECT_EQ((time - local.offsetFromUTC).time_since_epoch(), seconds(1'700'000'000));
}

REGISTER_TYPED_TEST_SUITE_P(ClockContract, UptimesMoveOnWithTime,
                            ProcessHasNotRunLongerThanTheSystem, DateIsOfThisCentury,
                            LocalTimeIsUTCWithItsOffset);

}  // namespace halvox::platform::contract
