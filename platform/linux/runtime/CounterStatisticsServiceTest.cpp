#include "platform/linux/runtime/CounterStatisticsService.h"

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(CounterStatisticsServiceTest, SnapshotListsAllCountersInOrder) {
  CounterStatisticsService service;
  service.counter("session", "suppressed").add(2);
  service.counter("log", "received").add();
  service.counter("session", "delivered");

  const std::vector<CounterReading> expected{
      {"log", "received", 1}, {"session", "delivered", 0}, {"session", "suppressed", 2}};
  EXPECT_EQ(service.snapshot(), expected);
}

TEST(CounterStatisticsServiceTest, SnapshotOfNoCountersIsEmpty) {
  EXPECT_TRUE(CounterStatisticsService().snapshot().empty());
}

TEST(CounterStatisticsServiceTest, CountersStayWhereTheyAreWhenOthersAreMade) {
  CounterStatisticsService service;
  Counter& counter = service.counter("session", "m");
  for (char name = 'a'; name <= 'z'; ++name) service.counter("session", {&name, 1});

  counter.add(3);

  EXPECT_EQ(&service.counter("session", "m"), &counter);
  EXPECT_EQ(service.counter("session", "m").value(), 3U);
}

}  // namespace
}  // namespace halvox::platform::linux_
