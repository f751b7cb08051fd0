#include "platform/linux/connection/StandardInterfaces.h"

#include <array>
#include <cstdio>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/Introspection.h"
#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

constexpr const char* kBus = "org.freedesktop.DBus";
constexpr const char* kBusPath = "/org/freedesktop/DBus";
constexpr const char* kProperties = "org.freedesktop.DBus.Properties";
constexpr const char* kStatistics = "com.tarno.halvox.Statistics";
constexpr const char* kStorage = "com.tarno.halvox.Storage";
constexpr const char* kServiceName = "com.tarno.halvox.reporting";

// Returns what a command prints on its standard output and standard error. Only for the test's own
// commands.
std::string outputOf(const std::string& command) {
  const UniqueHandle<std::FILE*, pclose> pipe(popen((command + " 2>&1").c_str(), "r"));
  std::string output;
  std::array<char, 4096> buffer;
  while (const std::size_t count = fread(buffer.data(), 1, buffer.size(), pipe.get())) {
    output.append(buffer.data(), count);
  }
  return output;
}

BusAnswer askBus(BusClient& client, const std::string& member,
                 const std::vector<std::string>& texts = {}) {
  return client.callAt(kBusPath, kBus, member, texts);
}

TEST(StandardInterfacesTest, PingIsAnsweredAtAnyPath) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.callAt("/any/path", "org.freedesktop.DBus.Peer", "Ping").errorName, "");
}

TEST(StandardInterfacesTest, MachineIdIsAnsweredOrSaidToBeMissing) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer = client.callAt("/", "org.freedesktop.DBus.Peer", "GetMachineId");

  EXPECT_TRUE(answer.text.size() == 32 || answer.errorName == "org.freedesktop.DBus.Error.Failed");
}

TEST(StandardInterfacesTest, IntrospectionOfTheObjectListsItsMethodsWithTheirTypes) {
  const std::string xml = introspectionOf(testInterface(), kTestPath);

  EXPECT_THAT(xml, HasSubstr("<interface name=\"com.tarno.test.Object\">"));
  EXPECT_THAT(xml, HasSubstr("  <method name=\"take\">\n"
                             "   <arg type=\"a{sv}\" direction=\"in\"/>\n"
                             "   <arg type=\"u\" direction=\"in\"/>\n"
                             "   <arg type=\"q\" direction=\"in\"/>\n"
                             "   <arg type=\"aax\" direction=\"in\"/>\n"
                             "  </method>\n"));
  EXPECT_THAT(xml, HasSubstr("org.freedesktop.DBus.Properties"));
}

TEST(StandardInterfacesTest, IntrospectionOfAParentNamesTheNextChildOnly) {
  EXPECT_THAT(introspectionOf(testInterface(), "/"),
              AllOf(HasSubstr("<node name=\"com\"/>"), Not(HasSubstr("com.tarno.test.Object"))));
  EXPECT_THAT(introspectionOf(testInterface(), "/com/tarno"), HasSubstr("<node name=\"test\"/>"));
}

TEST(StandardInterfacesTest, PartOfAnElementIsNoParent) {
  EXPECT_TRUE(isParentPath("/", "/com/tarno"));
  EXPECT_TRUE(isParentPath("/com", "/com/tarno"));
  EXPECT_FALSE(isParentPath("/co", "/com/tarno"));
  EXPECT_FALSE(isParentPath("/com/tarno", "/com/tarno"));
}

TEST(StandardInterfacesTest, PathBesideTheObjectIsUnknown) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer =
      client.callAt("/com/other", "org.freedesktop.DBus.Introspectable", "Introspect");

  EXPECT_EQ(answer.errorName, "org.freedesktop.DBus.Error.UnknownObject");
}

TEST(StandardInterfacesTest, ThereAreNoProperties) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.callAt(kTestPath, kProperties, "GetAll", {kTestInterface}).text, "a{sv}");
  EXPECT_EQ(client.callAt(kTestPath, kProperties, "Get", {kTestInterface, "Color"}).errorName,
            "org.freedesktop.DBus.Error.UnknownProperty");
}

TEST(StandardInterfacesTest, CountersAreReadWhenAClientAsks) {
  std::uint64_t reads = 0;
  const ServiceUnderTest service([&](ConnectionOptions& options) {
    options.counters = [&reads] { return Dictionary{{"store, received", ++reads}}; };
  });
  BusClient client(service.address());
  EXPECT_EQ(reads, 0U);

  EXPECT_EQ(client.callAt(kTestPath, kStatistics, "GetCounters").text, "a{sv}");
  EXPECT_EQ(reads, 1U);
  EXPECT_EQ(client.callAt("/", kStatistics, "GetCounters").errorName,
            "org.freedesktop.DBus.Error.UnknownInterface");
}

TEST(StandardInterfacesTest, AServiceThatReadsNoCountersAnswersWithNone) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.callAt(kTestPath, kStatistics, "GetCounters").errorName, "");
}

// Calls BeginVacuum with the option "to". Returns the message of the error, or an empty text.
std::string beginVacuum(const BusClient& client, std::uint64_t bytes) {
  sd_bus_error error = SD_BUS_ERROR_NULL;
  const int result =
      sd_bus_call_method(client.get(), kServiceName, kTestPath, kStorage, "BeginVacuum", &error,
                         nullptr, "a{sv}", 1, "to", "t", bytes);
  std::string message = result < 0 && error.message != nullptr ? error.message : "";
  sd_bus_error_free(&error);
  return message;
}

TEST(StandardInterfacesTest, TheStoreGetsTheOptionsOfAVacuum) {
  std::uint64_t wanted = 0;
  const ServiceUnderTest service([&](ConnectionOptions& options) {
    options.storage.beginVacuum = [&wanted](const Dictionary& given) {
      wanted = given.find("to")->toUInt64();
      return std::string(wanted > 5 ? "" : "too small");
    };
  });
  const BusClient client(service.address());

  EXPECT_EQ(beginVacuum(client, 7), "");
  EXPECT_EQ(wanted, 7U);
  EXPECT_EQ(beginVacuum(client, 5), "too small");
}

TEST(StandardInterfacesTest, WithoutAStoreThereIsNoVacuum) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(beginVacuum(client, 7), "there is no store");
  EXPECT_EQ(client.callAt(kTestPath, kStorage, "GetVacuum").errorName, "");
}

TEST(StandardInterfacesTest, TheStoreGetsTheSelectionOfAnErasure) {
  std::string wanted;
  const ServiceUnderTest service([&](ConnectionOptions& options) {
    options.storage.beginErase = [&wanted](const Dictionary& given) {
      wanted = given.find("app")->string();
      return std::string();
    };
  });
  BusClient client(service.address());
  const int result =
      sd_bus_call_method(client.get(), kServiceName, kTestPath, kStorage, "BeginErase", nullptr,
                         nullptr, "a{sv}", 1, "app", "s", "player");

  EXPECT_GE(result, 0);
  EXPECT_EQ(wanted, "player");
  EXPECT_EQ(client.callAt(kTestPath, kStorage, "GetErase").errorName, "");
}

TEST(StandardInterfacesTest, EveryPeerGetsAUniqueNameOnce) {
  const ServiceUnderTest service;
  BusClient first(service.address());
  BusClient second(service.address());

  EXPECT_NE(first.uniqueName(), second.uniqueName());
  EXPECT_EQ(askBus(first, "Hello").errorName, "org.freedesktop.DBus.Error.Failed");
}

TEST(StandardInterfacesTest, ServiceOwnsItsNameOnItsOwnSocket) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(askBus(client, "NameHasOwner", {kServiceName}).text, "true");
  EXPECT_EQ(askBus(client, "GetNameOwner", {kServiceName}).text, ":1.0");
  EXPECT_EQ(askBus(client, "NameHasOwner", {"com.example.Other"}).text, "false");
  EXPECT_EQ(askBus(client, "GetNameOwner", {"com.example.Other"}).errorName,
            "org.freedesktop.DBus.Error.NameHasNoOwner");
}

TEST(StandardInterfacesTest, MatchesAreAcceptedAndIdIsAnswered) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(askBus(client, "AddMatch", {"type='signal'"}).errorName, "");
  EXPECT_EQ(askBus(client, "RemoveMatch", {"type='signal'"}).errorName, "");
  EXPECT_EQ(askBus(client, "GetId").text.size(), 32U);
}

TEST(StandardInterfacesTest, BusctlIntrospectsAndCalls) {
  const ServiceUnderTest service;
  const std::string busctl = "busctl --address=" + service.address();
  const std::string object = std::string(kServiceName) + " " + kTestPath;

  EXPECT_THAT(outputOf(busctl + " introspect " + object), HasSubstr(".take"));
  EXPECT_THAT(outputOf(busctl + " tree " + kServiceName), HasSubstr(kTestPath));
  EXPECT_EQ(outputOf(busctl + " call " + object + " " + kTestInterface + " echo s hello"),
            "s \"hello\"\n");
}

// Makes a proxy as desktop programs do: Hello, matches, name owner, properties, introspection.
constexpr const char* kGlibProgram = R"py(
import sys
import gi
gi.require_version("Gio", "2.0")
from gi.repository import Gio, GLib
flags = (Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT |
         Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION)
bus = Gio.DBusConnection.new_for_address_sync(sys.argv[1], flags, None, None)
proxy = Gio.DBusProxy.new_sync(bus, 0, None, "com.tarno.halvox.reporting",
                               "/com/tarno/test/object", "com.tarno.test.Object", None)
reply = proxy.call_sync("echo", GLib.Variant("(s)", ("hello",)), 0, 5000, None)
print(proxy.get_name_owner(), reply.unpack()[0])
)py";

TEST(StandardInterfacesTest, GlibProxyWorksUnchanged) {
  if (!outputOf("/usr/bin/python3 -c 'import gi'").empty()) GTEST_SKIP() << "no GLib bindings";
  const ServiceUnderTest service;

  EXPECT_EQ(
      outputOf("/usr/bin/python3 -c '" + std::string(kGlibProgram) + "' " + service.address()),
      ":1.0 hello\n");
}

}  // namespace
}  // namespace halvox::platform::linux_
