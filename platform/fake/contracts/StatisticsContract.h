#pragma once

#include <string>
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

  EXPECT_EQ(this->service_.counter("contract", "received").value(), 4000U);
}

TYPED_TEST_P(StatisticsContract, CountersStayWhereTheyAreWhileOthersAreMade) {
  Counter& counter = this->service_.counter("contract", "received");
  counter.add();

  for (int other = 0; other < 1000; ++other) {
    this->service_.counter("contract", "other " + std::to_string(other)).add();
  }

  EXPECT_EQ(&this->service_.counter("contract", "received"), &counter);
  EXPECT_EQ(counter.value(), 1U);
}

TYPED_TEST_P(StatisticsContract, EachServiceHasCountersOfItsOwn) {
  this->service_.counter("contract", "received").add();

  TypeParam other;
  Counter& counter = other.counter("contract", "received");
  EXPECT_EQ(counter.value(), 0U);
  counter.add(2);

  EXPECT_EQ(this->service_.counter("contract", "received").value(), 1U);
}

TYPED_TEST_P(StatisticsContract, AllCountersAreListedInTheOrderOfTheirNames) {
  this->service_.counter("contract", "received").add(2);
  this->service_.counter("contract", "dropped");
  this->service_.counter("another", "received").add();

  std::vector<std::string> listed;
  this->service_.forEachCounter([&](std::string_view piece, std::string_view name,
                                    std::uint64_t value) {
    listed.push_back(std::string(piece) + ": " + std::string(name) + " " + std::to_string(value));
  });

  EXPECT_EQ(listed, (std::vector<std::string>{"another: received 1", "contract: dropped 0",
                                              "contract: received 2"}));
}

REGISTER_TYPED_TEST_SUITE_P(StatisticsContract, SameNamesGiveTheSameCounter,
                            OtherNamesGiveOtherCounters, CountsOfAllThreadsAddUp,
                            CountersStayWhereTheyAreWhileOthersAreMade,
                            EachServiceHasCountersOfItsOwn,
                            AllCountersAreListedInTheOrderOfTheirNames);

}  // namespace halvox::platform::contract
