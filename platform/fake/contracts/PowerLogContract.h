#pragma once

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/power_log.h"

namespace halvox::platform::contract {

// A power event as it was recorded, with the entries "a" and "b" of its payload if it has them.
struct RecordedPowerEvent {
  std::uint32_t categoryID;
  std::string name;
  std::optional<std::int64_t> a;
  std::optional<std::int64_t> b;
  friend bool operator==(const RecordedPowerEvent&, const RecordedPowerEvent&) = default;
};

// What every PowerLogService promises.
//
// `Harness` is default-constructible and has
//   PowerLogService& service();
//   std::vector<RecordedPowerEvent> recorded();  all events so far; called once, after the last one
template <typename Harness>
class PowerLogContract : public ::testing::Test {
 protected:
  Harness harness_;
};
TYPED_TEST_SUITE_P(PowerLogContract);

TYPED_TEST_P(PowerLogContract, EventIsItsCategoryItsNameAndItsPayload) {
  this->harness_.service().logPowerEvent(28, "Oxbow", {{"a", 1}, {"b", 2}}, std::nullopt);

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedPowerEvent{28, "Oxbow", 1, 2}));
}

TYPED_TEST_P(PowerLogContract, AnyCategoryAndAnEmptyPayloadWillDo) {
  constexpr std::uint32_t kGreatest = std::numeric_limits<std::uint32_t>::max();

  this->harness_.service().logPowerEvent(0, "", {}, std::nullopt);
  this->harness_.service().logPowerEvent(kGreatest, "Last", {}, Dictionary());

  EXPECT_THAT(
      this->harness_.recorded(),
      ::testing::ElementsAre(RecordedPowerEvent{0, "", std::nullopt, std::nullopt},
                             RecordedPowerEvent{kGreatest, "Last", std::nullopt, std::nullopt}));
}

TYPED_TEST_P(PowerLogContract, ExtraEntriesAreRecordedUnlessThePayloadHasTheirKey) {
  this->harness_.service().logPowerEvent(28, "Both", {{"a", 1}}, Dictionary{{"a", 2}, {"b", 3}});

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedPowerEvent{28, "Both", 1, 3}));
}

TYPED_TEST_P(PowerLogContract, DictionariesMayChangeOnceTheEventIsLogged) {
  Dictionary payload{{"a", 1}};
  std::string name = "Oxbow";

  this->harness_.service().logPowerEvent(28, name, payload, std::nullopt);
  payload.set("a", 2);
  name = "Other";

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedPowerEvent{28, "Oxbow", 1, std::nullopt}));
}

TYPED_TEST_P(PowerLogContract, EventsKeepTheirOrderEqualOnesToo) {
  for (const std::uint32_t category : {3U, 1U, 1U, 2U}) {
    this->harness_.service().logPowerEvent(category, "e", {{"a", 1}}, std::nullopt);
  }

  std::vector<std::uint32_t> categories;
  for (const RecordedPowerEvent& event : this->harness_.recorded()) {
    categories.push_back(event.categoryID);
  }
  EXPECT_EQ(categories, (std::vector<std::uint32_t>{3, 1, 1, 2}));
}

REGISTER_TYPED_TEST_SUITE_P(PowerLogContract, EventIsItsCategoryItsNameAndItsPayload,
                            AnyCategoryAndAnEmptyPayloadWillDo,
                            ExtraEntriesAreRecordedUnlessThePayloadHasTheirKey,
                            DictionariesMayChangeOnceTheEventIsLogged,
                            EventsKeepTheirOrderEqualOnesToo);

}  // namespace halvox::platform::contract
