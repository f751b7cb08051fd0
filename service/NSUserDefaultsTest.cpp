#include "service/NSUserDefaults.h"

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::Value;

class NSUserDefaultsTest : public testing::Test {
 protected:
  void store(Value value) { platform_.preferences.set("suite", "key", std::move(value)); }

  platform::FakePlatform platform_;
  NSUserDefaults defaults_{"suite"};
};

TEST_F(NSUserDefaultsTest, AnAbsentKeyHasNeitherObjectNorStringAndIsFalse) {
  EXPECT_EQ(defaults_.objectForKey("key"), std::nullopt);
  EXPECT_EQ(defaults_.stringForKey("key"), std::nullopt);
  EXPECT_FALSE(defaults_.boolForKey("key"));
}

TEST_F(NSUserDefaultsTest, ReadsItsOwnSuite) {
  platform_.preferences.set("another", "key", "text");

  EXPECT_EQ(defaults_.objectForKey("key"), std::nullopt);
}

TEST_F(NSUserDefaultsTest, TheObjectIsTheValueAsStored) {
  const Value list = platform::Array{1, "two"};
  store(list);

  EXPECT_EQ(defaults_.objectForKey("key"), list);
}

TEST_F(NSUserDefaultsTest, AStringIsItself) {
  store("");
  EXPECT_EQ(defaults_.stringForKey("key"), "");
  store("kitchen");
  EXPECT_EQ(defaults_.stringForKey("key"), "kitchen");
}

TEST_F(NSUserDefaultsTest, TheStringOfANumberIsItsText) {
  store(7);
  EXPECT_EQ(defaults_.stringForKey("key"), "7");
  store(0.5);
  EXPECT_EQ(defaults_.stringForKey("key"), "0.5");
  store(true);
  EXPECT_EQ(defaults_.stringForKey("key"), "1");
}

TEST_F(NSUserDefaultsTest, OtherValuesHaveNoString) {
  for (const Value& value : {Value(platform::Array{"a"}), Value(platform::Dictionary{{"a", 1}}),
                             Value(platform::Date{1})}) {
    store(value);
    EXPECT_EQ(defaults_.stringForKey("key"), std::nullopt);
  }
}

TEST_F(NSUserDefaultsTest, NumbersAreTrueUnlessTheyAreZero) {
  for (const Value& value : {Value(true), Value(1), Value(-1), Value(0.5)}) {
    store(value);
    EXPECT_TRUE(defaults_.boolForKey("key"));
  }
  for (const Value& value : {Value(false), Value(0), Value(0.0)}) {
    store(value);
    EXPECT_FALSE(defaults_.boolForKey("key"));
  }
}

TEST_F(NSUserDefaultsTest, TheStringsYesAndTrueAreTrue) {
  for (const char* text : {"YES", "yes", "true", "True"}) {
    store(text);
    EXPECT_TRUE(defaults_.boolForKey("key")) << text;
  }
  for (const char* text : {"NO", "false", "", "yes ", "truely", "1"}) {
    store(text);
    EXPECT_FALSE(defaults_.boolForKey("key")) << text;
  }
}

TEST_F(NSUserDefaultsTest, OtherValuesAreFalse) {
  store(platform::Array{true});
  EXPECT_FALSE(defaults_.boolForKey("key"));
}

}  // namespace
}  // namespace halvox
