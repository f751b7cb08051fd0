#pragma once

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/preferences.h"

namespace halvox::platform::contract {

// What every PreferenceService promises. `Harness` has
//   PreferenceService& service();
//   void set(const std::string& domain, const std::string& key, const Value& value);
//     // for the user "mobile"; texts, integers, reals and booleans
//   void remove(const std::string& domain, const std::string& key);
template <typename Harness>
class PreferenceContract : public ::testing::Test {
 protected:
  std::optional<Value> at(std::string_view key, std::string_view domain = "org.example",
                          std::string_view user = "mobile") {
    return harness_.service().CFPreferencesCopyValue(key, domain, user);
  }
  void set(const std::string& key, const Value& value) { harness_.set("org.example", key, value); }

  Harness harness_;
};
TYPED_TEST_SUITE_P(PreferenceContract);

TYPED_TEST_P(PreferenceContract, ValuesAreWhatWasSet) {
  const std::vector<std::pair<std::string, Value>> values = {
      {"text", "D1"}, {"empty", ""}, {"integer", -7}, {"real", 0.5}, {"on", true}, {"off", false}};
  for (const auto& [key, value] : values) this->set(key, value);

  for (const auto& [key, value] : values) EXPECT_EQ(this->at(key), value) << key;
}

TYPED_TEST_P(PreferenceContract, WhatIsNotThereHasNoValue) {
  EXPECT_EQ(this->at("key"), std::nullopt);

  this->set("key", 1);

  EXPECT_EQ(this->at("other"), std::nullopt);
  EXPECT_EQ(this->at("key", "org.other"), std::nullopt);
  EXPECT_EQ(this->at("key", "org.example", "root"), std::nullopt);
  EXPECT_EQ(this->at(""), std::nullopt);
  EXPECT_EQ(this->at("key", ""), std::nullopt);
  EXPECT_EQ(this->at("key", "org.example", ""), std::nullopt);
}

TYPED_TEST_P(PreferenceContract, NamesAreComparedByteForByte) {
  this->set("key", 1);

  EXPECT_EQ(this->at("Key"), std::nullopt);
  EXPECT_EQ(this->at("key "), std::nullopt);
  EXPECT_EQ(this->at("key", "org.Example"), std::nullopt);
}

TYPED_TEST_P(PreferenceContract, DomainsAreSeparate) {
  this->harness_.set("org.one", "key", 1);
  this->harness_.set("org.two", "key", 2);

  EXPECT_EQ(this->at("key", "org.one"), Value(1));
  EXPECT_EQ(this->at("key", "org.two"), Value(2));
}

TYPED_TEST_P(PreferenceContract, EachCallReadsAfresh) {
  this->set("key", "first");
  EXPECT_EQ(this->at("key"), Value("first"));

  this->set("key", "other");
  EXPECT_EQ(this->at("key"), Value("other"));

  this->harness_.remove("org.example", "key");
  EXPECT_EQ(this->at("key"), std::nullopt);
}

TYPED_TEST_P(PreferenceContract, SuitesAreDomainsOfTheUserOfTheService) {
  this->set("key", 7);

  EXPECT_EQ(this->harness_.service().suiteValue("org.example", "key"), Value(7));
  EXPECT_EQ(this->harness_.service().suiteValue("org.other", "key"), std::nullopt);
}

REGISTER_TYPED_TEST_SUITE_P(PreferenceContract, ValuesAreWhatWasSet, WhatIsNotThereHasNoValue,
                            NamesAreComparedByteForByte, DomainsAreSeparate, EachCallReadsAfresh,
                            SuitesAreDomainsOfTheUserOfTheService);

}  // namespace halvox::platform::contract
