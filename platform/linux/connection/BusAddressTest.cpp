#include "platform/linux/connection/BusAddress.h"

#include <cstdlib>

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

TEST(BusAddressTest, OtherTransportsAreSkipped) {
  EXPECT_THAT(parseBusAddress("tcp:host=localhost,port=1;unix:path=/a;autolaunch:"),
              ElementsAre(BusSocket{Space::kFile, "/a"}));
}

TEST(BusAddressTest, NonsenseIsSkipped) {
  EXPECT_THAT(parseBusAddress("unix:path=/a%2"), IsEmpty());
  EXPECT_THAT(parseBusAddress("unix:path=/a%zz"), IsEmpty());
  EXPECT_THAT(parseBusAddress("unix:path="), IsEmpty());
  EXPECT_THAT(parseBusAddress("unix:"), IsEmpty());
  EXPECT_THAT(parseBusAddress(";;,=%"), IsEmpty());
  EXPECT_THAT(parseBusAddress(""), IsEmpty());
}

class StarterBusTest : public testing::Test {
 protected:
  // The bus that an environment with these three variables names. Null means that the variable is
  // not set.
  static std::optional<StarterBus> starterOf(const char* type, const char* address,
                                             const char* systemBus = nullptr) {
    set("DBUS_STARTER_BUS_TYPE", type);
    set("DBUS_STARTER_ADDRESS", address);
    set("DBUS_SYSTEM_BUS_ADDRESS", systemBus);
    return starterBus();
  }
  void TearDown() override { starterOf(nullptr, nullptr); }

 private:
  static void set(const char* name, const char* value) {
    value == nullptr ? unsetenv(name) : setenv(name, value, 1);
  }
};

TEST_F(StarterBusTest, IsTheOneThatTheEnvironmentNames) {
  EXPECT_EQ(starterOf("session", "unix:path=/a"), (StarterBus{BusKind::kSession, "unix:path=/a"}));
  EXPECT_EQ(starterOf("system", "unix:path=/a"), (StarterBus{BusKind::kSystem, "unix:path=/a"}));
  EXPECT_EQ(starterOf("other", "unix:path=/a"), (StarterBus{BusKind::kNone, "unix:path=/a"}));
  EXPECT_EQ(starterOf(nullptr, "unix:path=/a"), (StarterBus{BusKind::kNone, "unix:path=/a"}));
}

TEST_F(StarterBusTest, IsAtItsUsualAddressWhenTheKindAloneIsNamed) {
  EXPECT_EQ(starterOf("system", nullptr, "unix:path=/b"),
            (StarterBus{BusKind::kSystem, "unix:path=/b"}));
  EXPECT_EQ(starterOf("system", ""),
            (StarterBus{BusKind::kSystem, "unix:path=/run/dbus/system_bus_socket"}));
}

TEST_F(StarterBusTest, IsNoneWhereNothingIsNamed) {
  EXPECT_EQ(starterOf(nullptr, nullptr), std::nullopt);
  EXPECT_EQ(starterOf("other", ""), std::nullopt);
}

}  // namespace
}  // namespace halvox::platform::linux_
