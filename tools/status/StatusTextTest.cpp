#include "tools/status/StatusText.h"

#include <span>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/TextTable.h"
#include "tools/status/StatusSource.h"

namespace halvox::tools {
namespace {

using platform::linux_::BusKind;
using platform::linux_::Configuration;
using platform::linux_::LinkBackend;
using platform::linux_::OptionalPart;
using platform::linux_::serviceParts;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

ServiceStatus running() {
  ServiceStatus status;
  status.now = 1'000'000;
  status.version = "1.2.3";
  status.service.isConnected = true;
  status.service.uptimeSeconds = 7200;
  status.service.clients = 4;
  status.service.sessions = 6;
  status.service.messagesPerSecond = 2.5;
  status.service.storeBytes = 3 * 1024 * 1024;
  status.process = 4711;
  status.cost = {.cpuSeconds = 1.5, .wakeUps = 100, .bytesWritten = 1024};
  status.losses = {{.piece = "link local", .reason = "dropped: disk full", .total = 12}};
  status.places.database = "/a/rather/long/path/to/the/directory/of/the/service/halvox.db";
  status.storeLimitBytes = 512ULL * 1024 * 1024;
  status.retentionDays = 30;
  status.off = {{"PipeWire counters", "drivers.pipewire is false"}};
  return status;
}

TEST(StatusTextTest, ItShowsFiguresLossesCostsAndWhatIsOff) {
  const std::string text = statusText(running(), std::nullopt);

  EXPECT_THAT(text, AllOf(HasSubstr("The service runs.\n"), HasSubstr("clients 4, sessions 6\n"),
                          HasSubstr("up 2h00m00s\n"), HasSubstr("messages 2.5/s"),
                          HasSubstr("wake-ups 50 per hour, written 12.0 KiB per day\n"),
                          HasSubstr("link local, dropped: disk full: 12\n"),
                          HasSubstr("database 3.0 MiB, at most 512.0 MiB, kept 30 days"),
                          HasSubstr("PipeWire counters: drivers.pipewire is false\n")));
}

TEST(StatusTextTest, NoLineIsWiderThanTheTerminal) {
  for (const std::size_t width : {80UL, 40UL, 20UL}) {
    std::istringstream lines(statusText(running(), width));
    for (std::string line; std::getline(lines, line);) {
      EXPECT_LE(displayWidth(line), width) << line;
    }
  }
}

TEST(StatusTextTest, NarrowLinesKeepTheirWordsAndTheEndsOfPaths) {
  const std::string text = statusText(running(), 40);

  EXPECT_THAT(text, HasSubstr("drivers.pipewire is false"));
  EXPECT_THAT(text, HasSubstr("/halvox.db\n"));
  EXPECT_THAT(text, HasSubstr("at most 512.0 MiB"));
}

TEST(StatusTextTest, WithoutAServiceItShowsTheReasonAndTheFiles) {
  ServiceStatus status = running();
  status.service.isConnected = false;
  status.service.problem = "no service\x1b[31m";

  const std::string text = statusText(status, std::nullopt);

  EXPECT_THAT(text, AllOf(HasSubstr("The service does not run"), HasSubstr("no service"),
                          HasSubstr("halvox.db"), HasSubstr("3.0 MiB, at most")));
  EXPECT_THAT(text,
              AllOf(Not(HasSubstr("\x1b")), Not(HasSubstr("clients")), Not(HasSubstr("cost"))));
}

TEST(StatusTextTest, JsonHasNullForWhatIsNotKnown) {
  ServiceStatus status = running();
  status.cost.bytesWritten.reset();

  const std::string json = statusJson(status);

  EXPECT_THAT(json,
              AllOf(HasSubstr("\"running\":true"), HasSubstr("\"process\":4711"),
                    HasSubstr("\"bytes_written\":null,\"bytes_written_per_day\":null"),
                    HasSubstr("\"wakeups_per_hour\":50"), HasSubstr("\"captures_bytes\":null")));
}

TEST(StatusTextTest, ACountOfAServiceThatHasJustStartedIsNotScaled) {
  EXPECT_EQ(perPeriod(10, 0.5, 3600), std::nullopt);
  EXPECT_EQ(perPeriod(10, std::nullopt, 3600), std::nullopt);
  EXPECT_EQ(perPeriod(10, 1800, 3600), 20);
}

TEST(StatusSourceTest, ProcessorTimeIsUserAndSystemTimeWhateverTheCommandIsCalled) {
  EXPECT_EQ(cpuTicks("12 (a) b (c) S 1 2 3 4 5 6 7 8 9 10 30 12 0 0"), 42U);
  EXPECT_EQ(cpuTicks("12 (name) S 1 2"), std::nullopt);
  EXPECT_EQ(cpuTicks(""), std::nullopt);
}

TEST(StatusSourceTest, ANumberOfProcfsIsThatOfTheWholeName) {
  const char* const text = "nonvoluntary_ctxt_switches:\t9\nvoluntary_ctxt_switches:\t7\n";

  EXPECT_EQ(numberAfter(text, "voluntary_ctxt_switches"), 7U);
  EXPECT_EQ(numberAfter(text, "write_bytes"), std::nullopt);
  EXPECT_EQ(numberAfter("write_bytes: x", "write_bytes"), std::nullopt);
}

std::string reasons(const Configuration& configuration, std::span<const OptionalPart> parts) {
  std::string all;
  for (const SwitchedOff& off : switchedOff(configuration, parts)) {
    all += off.what + ": " + off.why + "\n";
  }
  return all;
}

Configuration withEverythingOn() {
  Configuration configuration;
  configuration.link.backend = LinkBackend::kNats;
  configuration.listener.bus = BusKind::kSystem;
  configuration.tracePoints = true;
  configuration.device = {{"InternalBuild", true}};
  configuration.features["Acoustat"]["Tracing"] = true;
  return configuration;
}

TEST(StatusSourceTest, WhatIsSwitchedOffNamesTheSetting) {
  Configuration configuration;
  configuration.link.backend = LinkBackend::kNone;
  configuration.analytics.wanted = {"a*"};
  configuration.drivers.alsa = false;
  configuration.drivers.pipewire = false;

  EXPECT_EQ(reasons(configuration, serviceParts()),
            "real-time link: link.backend is \"none\"\n"
            "some events: analytics.wanted does not contain \"*\"\n"
            "message bus: listener.bus is \"none\"\n"
            "summary files, captures: device.InternalBuild is not true\n"
            "ALSA counters: drivers.alsa is false\n"
            "PipeWire counters: drivers.pipewire is false\n"
            "NATS link: link.backend is not \"nats\"\n"
            "LTTng trace points: diagnostics.trace_points is not true\n"
            "LTTng traces: features.Acoustat.Tracing is not true\n");
}

TEST(StatusSourceTest, WhatThisBuildLacksIsOffToo) {
  const OptionalPart parts[] = {{"NATS link", "HALVOX_NATS", false},
                                {"LTTng traces", "HALVOX_TRACING", true}};

  EXPECT_EQ(reasons(withEverythingOn(), parts), "NATS link: this build has no HALVOX_NATS\n");
}

TEST(StatusSourceTest, TracesSwitchTheTracePointsOn) {
  const OptionalPart parts[] = {{"LTTng trace points", "HALVOX_WITH_LTTNG", true}};
  Configuration configuration = withEverythingOn();
  configuration.tracePoints = false;

  EXPECT_EQ(reasons(configuration, parts), "");
}

}  // namespace
}  // namespace halvox::tools
