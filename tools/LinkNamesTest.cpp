#include "tools/LinkNames.h"

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using platform::linux_::StoredRecord;

StoredRecord message(std::int64_t category, std::int64_t type, const std::string& payload) {
  return {1, 100, {std::int64_t{7}, "client", "music", category, type, payload}};
}

StoredRecord tagged(std::int64_t category, std::int64_t type, const std::string& tag) {
  return message(category, type, R"({"a":1,"audiotag":")" + tag + "\"}");
}

TEST(LinkNamesTest, TheDomainIsTakenFromTheTag) {
  EXPECT_EQ(linkCategoryName(tagged(4, 1, "Session_PlaybackStart")), "Session_Playback");
  EXPECT_EQ(linkCategoryName(tagged(4, 1, "PlaybackStart")), "Playback");
  EXPECT_EQ(linkCategoryName(tagged(4, 1, "_PlaybackStart")), "_Playback");
}

TEST(LinkNamesTest, ATagThatDisagreesWithTheNumbersIsIgnored) {
  for (const char* tag :
       {"Session_RecordStart", "Session_PlaybackStop", "Evil_PlaybackStart", ""}) {
    EXPECT_EQ(linkCategoryName(tagged(4, 1, tag)), "Playback") << tag;
  }
  EXPECT_EQ(linkCategoryName(message(4, 1, "{}")), "Playback");
  EXPECT_EQ(linkCategoryName(message(4, 1, R"({"audiotag":7})")), "Playback");
  EXPECT_EQ(linkCategoryName(message(4, 1, "not JSON")), "Playback");
}

TEST(LinkNamesTest, WhatHasNoNameIsItsNumber) {
  EXPECT_EQ(linkCategoryName(tagged(99, 0, "Session_UndefinedGeneric")), "Session_99");
  EXPECT_EQ(linkTypeName(message(4, 99, "{}")), "99");
  EXPECT_EQ(linkTypeName(message(4, 0, "{}")), "0");
  EXPECT_EQ(linkTypeName(message(4, 65535, "{}")), "Unknown");
}

TEST(LinkNamesTest, ACategoryWithoutADomainStandsForAllDomains) {
  const StoredRecord session = tagged(4, 1, "Session_PlaybackStart");
  const StoredRecord plain = tagged(4, 1, "PlaybackStart");
  const auto matches = [](const StoredRecord& record, std::vector<std::int64_t> categories) {
    return isOfCategory(record, categories);
  };

  EXPECT_TRUE(matches(session, {0x08000004}));
  EXPECT_FALSE(matches(plain, {0x08000004}));
  EXPECT_FALSE(matches(session, {0x10000004}));
  EXPECT_TRUE(matches(session, {4}));
  EXPECT_TRUE(matches(plain, {0x08000003, 4}));
  EXPECT_FALSE(matches(plain, {5}));
  EXPECT_TRUE(matches(plain, {}));
}

}  // namespace
}  // namespace halvox::tools
