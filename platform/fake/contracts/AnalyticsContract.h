#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/analytics.h"

namespace halvox::platform::contract {

// An event as it was recorded: its name, and the entry "number" of its payload.
using RecordedEvent = std::pair<std::string, std::int64_t>;

// What every AnalyticsService promises.
//
// `Harness` is constructed with the names that are wanted and has
//   AnalyticsService& service();
//   std::vector<RecordedEvent> recorded();
//     all events so far, after every payload has been built; called once, after the last event
template <typename Harness>
class AnalyticsContract : public ::testing::Test {
 protected:
  static AnalyticsPayloadBuilder numbered(std::int64_t number) {
    return [number] { return Dictionary{{"number", number}}; };
  }

  Harness harness_{{"com.tarno.wanted"}};
};
TYPED_TEST_SUITE_P(AnalyticsContract);

TYPED_TEST_P(AnalyticsContract, OnlyWantedNamesAreUsed) {
  AnalyticsService& service = this->harness_.service();

  EXPECT_TRUE(service.isAnalyticsEventUsed("com.tarno.wanted"));
  EXPECT_FALSE(service.isAnalyticsEventUsed("com.tarno.other"));
  EXPECT_FALSE(service.isAnalyticsEventUsed("com.tarno.wanted.too"));
  EXPECT_FALSE(service.isAnalyticsEventUsed("Com.tarno.wanted"));
  EXPECT_FALSE(service.isAnalyticsEventUsed(""));
}

TYPED_TEST_P(AnalyticsContract, WhatIsSentIsRecordedWhetherItsNameIsWantedOrNot) {
  this->harness_.service().sendAnalyticsEventLazy("com.tarno.wanted", this->numbered(1));
  this->harness_.service().sendAnalyticsEventLazy("com.tarno.other", this->numbered(2));

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedEvent{"com.tarno.wanted", 1},
                                     RecordedEvent{"com.tarno.other", 2}));
}

TYPED_TEST_P(AnalyticsContract, EventsOfOneThreadKeepTheirOrder) {
  constexpr std::int64_t kCount = 1000;
  for (std::int64_t number = 0; number < kCount; ++number) {
    this->harness_.service().sendAnalyticsEventLazy("e", this->numbered(number / 2));
  }

  const std::vector<RecordedEvent> recorded = this->harness_.recorded();

  ASSERT_EQ(recorded.size(), static_cast<std::size_t>(kCount));
  for (std::int64_t number = 0; number < kCount; ++number) {
    ASSERT_EQ(recorded[static_cast<std::size_t>(number)].second, number / 2);
  }
}

TYPED_TEST_P(AnalyticsContract, EventsOfManyThreadsAreAllRecorded) {
  constexpr int kThreads = 4;
  constexpr std::int64_t kEach = 250;
  std::vector<std::thread> senders;
  for (int thread = 0; thread < kThreads; ++thread) {
    senders.emplace_back([this] {
      for (std::int64_t number = 0; number < kEach; ++number) {
        this->harness_.service().sendAnalyticsEventLazy("e", this->numbered(number));
      }
    });
  }
  for (std::thread& sender : senders) sender.join();

  EXPECT_EQ(this->harness_.recorded().size(), static_cast<std::size_t>(kThreads * kEach));
}

TYPED_TEST_P(AnalyticsContract, PayloadIsBuiltOnceAndNotWithinTheSending) {
  const std::thread::id sender = std::this_thread::get_id();
  std::atomic<bool> isSending{true};
  std::atomic<int> built{0};
  std::atomic<int> builtWithin{0};

  this->harness_.service().sendAnalyticsEventLazy("e", [&] {
    ++built;
    if (isSending && std::this_thread::get_id() == sender) ++builtWithin;
    return Dictionary{{"number", 1}};
  });
  isSending = false;

  EXPECT_THAT(this->harness_.recorded(), ::testing::ElementsAre(RecordedEvent{"e", 1}));
  EXPECT_EQ(built, 1);
  EXPECT_EQ(builtWithin, 0);
}

TYPED_TEST_P(AnalyticsContract, BuilderSeesWhatChangedAfterTheSending) {
  const auto gate = std::make_shared<std::atomic<std::int64_t>>(0);
  // The builder waits until this thread changes `gate`, which happens after the sending.
  this->harness_.service().sendAnalyticsEventLazy("e", [gate] {
    while (*gate == 0) std::this_thread::yield();
    return Dictionary{{"number", gate->load()}};
  });
  *gate = 7;

  EXPECT_THAT(this->harness_.recorded(), ::testing::ElementsAre(RecordedEvent{"e", 7}));
}

TYPED_TEST_P(AnalyticsContract, BuilderIsLetGoOfOnceItsPayloadIsBuilt) {
  auto held = std::make_shared<int>(1);
  const std::weak_ptr<int> watched = held;
  this->harness_.service().sendAnalyticsEventLazy("e", [held = std::move(held)] {
    return Dictionary{{"number", *held}};
  });

  EXPECT_EQ(this->harness_.recorded().size(), 1U);

  EXPECT_TRUE(watched.expired());
}

REGISTER_TYPED_TEST_SUITE_P(AnalyticsContract, OnlyWantedNamesAreUsed,
                            WhatIsSentIsRecordedWhetherItsNameIsWantedOrNot,
                            EventsOfOneThreadKeepTheirOrder, EventsOfManyThreadsAreAllRecorded,
                            PayloadIsBuiltOnceAndNotWithinTheSending,
                            BuilderSeesWhatChangedAfterTheSending,
                            BuilderIsLetGoOfOnceItsPayloadIsBuilt);

}  // namespace halvox::platform::contract
