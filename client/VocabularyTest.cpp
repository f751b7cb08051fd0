#include "client/Vocabulary.h"

#include <gtest/gtest.h>

namespace halvox::client {
namespace {

TEST(VocabularyTest, CategoryNamesPutTheDomainFirst) {
  EXPECT_EQ(categoryName(4), "Playback");
  EXPECT_EQ(categoryName(0x08000004), "Session_Playback");
  EXPECT_EQ(categoryName(makeCategory(CategoryProper::kError, Domain::kToolbox)), "Toolbox_Error");
}

TEST(VocabularyTest, CategoriesWithoutNameAreUndefinedBehindWhatDomainTheyHave) {
  EXPECT_EQ(categoryName(0), "Undefined");
  EXPECT_EQ(categoryName(0x40000000), "Routing_Undefined");
  EXPECT_EQ(categoryName(0x00030002), "_Record");
  EXPECT_EQ(categoryName(0x0C000001), "_Generic");
  EXPECT_EQ(categoryName(0xFFFFFFFF), "Undefined");
}

TEST(VocabularyTest, NamesAreFoundInAnyCaseOfLetters) {
  EXPECT_EQ(findCategory("session_PLAYBACK"), 0x08000004U);
  EXPECT_EQ(findEventType("midiDRIVER"), 10);
  EXPECT_EQ(findServiceType("Telephony"), 2);
}

TEST(VocabularyTest, EveryNameLeadsBackToItsNumber) {
  for (const auto& domain : domains()) {
    for (const auto& category : categories()) {
      const Category number = domain.number | category.number;
      EXPECT_EQ(findCategory(categoryName(number)), number);
    }
  }
  for (const auto& type : eventTypes()) EXPECT_EQ(findEventType(type.name), type.number);
  for (const auto& type : serviceTypes()) EXPECT_EQ(findServiceType(type.name), type.number);
}

TEST(VocabularyTest, UnknownNamesAreNotGuessedAt) {
  EXPECT_FALSE(findCategory("Session_"));
  EXPECT_FALSE(findCategory("Sessions_Playback"));
  EXPECT_FALSE(findCategory(""));
  EXPECT_FALSE(findEventType("Begin"));
  EXPECT_FALSE(findServiceType("music"));
}

TEST(VocabularyTest, NumbersWithoutNameAreNamedAsTheServiceNamesThem) {
  EXPECT_EQ(eventTypeName(0), "Generic");
  EXPECT_EQ(eventTypeName(65535), "Unknown");
  EXPECT_EQ(serviceTypeName(14), "telephony");
  EXPECT_EQ(serviceTypeName(65535), "unknown");
}

}  // namespace
}  // namespace halvox::client
