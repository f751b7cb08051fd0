#include "platform/linux/connection/BusAddress.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Space = BusSocket::Space;

TEST(BusAddressTest, NamesFilesAndAbstractSocketsInOrder) {
  EXPECT_THAT(
      parseBusAddress("unix:path=/run/bus,guid=00ff;unix:abstract=/tmp/x"),
      ElementsAre(BusSocket{Space::kFile, "/run/bus"}, BusSocket{Space::kAbstract, "/tmp/x"}));
}

TEST(BusAddressTest, EscapesAreResolved) {
  EXPECT_THAT(parseBusAddress("unix:guid=1,path=/a%20b%2C%3bc"),
              ElementsAre(BusSocket{Space::kFile, "/a b,;c"}));
}

TEST(BusAddressTest, OtherTransportsAreLeftOut) {
  EXPECT_THAT(parseBusAddress("tcp:host=localhost,port=1;unix:path=/a;autolaunch:"),
              ElementsAre(BusSocket{Space::kFile, "/a"}));
}

TEST(BusAddressTest, NonsenseIsLeftOut) {
  EXPECT_THAT(parseBusAddress("unix:path=/a%2"), IsEmpty());
  EXPECT_THAT(parseBusAddress("unix:path=/a%zz"), IsEmpty());
  EXPECT_THAT(parseBusAddress("unix:path="), IsEmpty());
  EXPECT_THAT(parseBusAddress("unix:"), IsEmpty());
  EXPECT_THAT(parseBusAddress(";;,=%"), IsEmpty());
  EXPECT_THAT(parseBusAddress(""), IsEmpty());
}

}  // namespace
}  // namespace halvox::platform::linux_
