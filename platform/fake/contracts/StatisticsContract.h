#pragma once

#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/statistics.h"

namespace halvox::platform::contract {

// What every StatisticsService promises. `Service` is default-constructible.
template <typename Service>
class StatisticsContract : public ::testing::Test {
 protected:
  Service service_;
};
TYPED_TEST_SUITE_P(StatisticsContract);

TYPED_TEST_P(StatisticsContract, SameNamesGiveTheSameCounter) {
  Counter& first = this->service_.counter("contract", "received");
  Counter& again = this->service_.counter("contract", "received");

  EXPECT_EQ(&first, &again);
}

TYPED_TEST_P(StatisticsContract, OtherNamesGiveOtherCounters) {
  Counter& counter = this->service_.counter("contract", "received");

  EXPECT_NE(&counter, &this->service_.counter("contract", "delivered"));
  EXPECT_NE(&counter, &this->service_.counter("other contract", "received"));
}

TYPED_TEST_P(StatisticsContract, CountsOfAllThreadsAddUp) {
  const std::uint64_t before = this->service_.counter("contract", "received").value();

  std::vector<std::thread> threads;
  threads.reserve(4);
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this] {
      for (int count = 0; count < 1000; ++count) {
        this->service_.counter("contract", "received").add();
      }
    });
  }
  for (std::thread& thread : threads) thread.join();

  EXPECT_EQ(this->service_.counter("contract", "received").value() - before, 4000U);
}

REGISTER_TYPED_TEST_SUITE_P(StatisticsContract, SameNamesGiveTheSameCounter,
                            OtherNamesGiveOtherCounters, CountsOfAllThreadsAddUp);

}  // namespace halvox::platform::contract
