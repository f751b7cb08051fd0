#include "platform/linux/version/VersionText.h"

#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/runtime/Version.h"

namespace halvox::platform::linux_ {
namespace {

using testing::ElementsAre;
using testing::Field;

TEST(VersionTextTest, TheCommitFollowsTheVersion) {
  EXPECT_EQ(versionText("halvoxctl", "0123456789ab", {}),
            std::string("halvoxctl ") + halvoxVersion() + " (0123456789ab)");
}

TEST(VersionTextTest, WithoutACommitThereIsOnlyTheVersion) {
  EXPECT_EQ(versionText("halvoxctl", "", {}), std::string("halvoxctl ") + halvoxVersion());
}

TEST(VersionTextTest, ThePartsAreSortedByWhetherTheyAreBuilt) {
  const OptionalPart parts[] = {
      {"one", "", true}, {"two", "", false}, {"three", "", true}, {"four", "", false}};

  EXPECT_EQ(versionText("x", "ab", parts), std::string("x ") + halvoxVersion() +
                                               " (ab)\nBuilt with: one, three\n"
                                               "Built without: two, four");
}

TEST(VersionTextTest, AHeadingWithoutPartsIsNotPrinted) {
  const OptionalPart part[] = {{"one", "", false}};

  EXPECT_EQ(versionText("x", "", part),
            std::string("x ") + halvoxVersion() + "\nBuilt without: one");
}

TEST(VersionTextTest, TheServiceNamesEachOptionalPartOnce) {
  const auto named = [](const char* name) { return Field(&OptionalPart::name, name); };

  EXPECT_THAT(serviceParts(),
              ElementsAre(named("ALSA counters"), named("PipeWire counters"), named("NATS link"),
                          named("LTTng trace points"), named("LTTng traces")));
}

}  // namespace
}  // namespace halvox::platform::linux_
