#include "analysis/Payload.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace halvox::analysis {
namespace {

using ::testing::ElementsAre;

TEST(PayloadTest, ValuesHaveTheirType) {
  Payload payload;
  payload.show(R"({"n":1.5,"i":-7,"b":true,"t":"a\"b\u00e4","l":["x",1,"y"]})");

  EXPECT_EQ(payload.number("n"), 1.5);
  EXPECT_EQ(payload.integer("n"), std::nullopt);
  EXPECT_EQ(payload.integer("i"), -7);
  EXPECT_EQ(payload.integer("b"), 1);
  EXPECT_EQ(payload.text("t"), "a\"bä");
  EXPECT_EQ(payload.text("i"), std::nullopt);
  EXPECT_FALSE(payload.has("none"));
  std::vector<std::string> texts;
  payload.forEachText("l", [&](std::string_view text) { texts.emplace_back(text); });
  EXPECT_THAT(texts, ElementsAre("x", "y"));
}

TEST(PayloadTest, TheShownTextIsNotChanged) {
  const std::string json = R"({"a":"\n","b":{"c":[1,"\t"]}})";
  const std::string before = json;
  Payload payload;
  payload.show(json);

  std::vector<std::string> members;
  payload.forEachMember([&](std::string_view key, std::string_view value) {
    members.push_back(std::string(key) + "=" + std::string(value));
  });

  EXPECT_THAT(members, ElementsAre(R"(a="\n")", R"(b={"c":[1,"\t"]})"));
  EXPECT_EQ(json, before);
  EXPECT_EQ(payload.json(), before);
}

TEST(PayloadTest, WhatIsNotAnObjectHasNoKeys) {
  Payload payload;
  for (const char* json : {"", "[1]", "{\"a\":1", "{\"a\":1}x", "null"}) {
    payload.show(json);
    EXPECT_FALSE(payload.has("a")) << json;
  }
  payload.show(R"({"a":1})");
  EXPECT_TRUE(payload.has("a"));
}

TEST(PayloadTest, DeepNestingDoesNotOverflowTheStack) {
  constexpr std::size_t kDepth = 1'000'000;
  const std::string json =
      R"({"a":)" + std::string(kDepth, '[') + std::string(kDepth, ']') + R"(,"b":2})";
  Payload payload;
  payload.show(json);
  EXPECT_EQ(payload.integer("b"), 2);
}

TEST(PayloadTest, DeepMembersDoNotOverflowTheStack) {
  constexpr std::size_t kDepth = 1'000'000;
  const std::string nested = std::string(kDepth, '[') + std::string(kDepth, ']');
  const std::string json = R"({"a":)" + nested + R"(,"b":2})";
  Payload payload;
  payload.show(json);
  std::vector<std::string> members;
  payload.forEachMember([&](std::string_view key, std::string_view value) {
    members.push_back(std::string(key) + "=" + std::string(value));
  });
  EXPECT_TRUE(members == (std::vector<std::string>{"a=" + nested, "b=2"}));
}

TEST(PayloadTest, BracketsInTextsAreNoNesting) {
  const std::string text(1000, '{');
  const std::string json = R"({"a":")" + text + R"(","b":2})";
  Payload payload;
  payload.show(json);
  EXPECT_EQ(payload.text("a"), text);
  EXPECT_EQ(payload.integer("b"), 2);
}

}  // namespace
}  // namespace halvox::analysis
