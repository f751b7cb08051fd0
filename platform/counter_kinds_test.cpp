#include <array>
#include <string_view>

#include <gtest/gtest.h>

#include "platform/counter_kinds.h"

namespace halvox::platform {
namespace {

// The names of the counters that the service has, without those of queues.
constexpr std::array<std::string_view, 58> kLosses{
    "absent: refused or not readable",
    "connections closed: malformed",
    "connections closed: timed out",
    "connections refused",
    "dropped: another in progress",
    "dropped: cannot be written",
    "dropped: database damaged",
    "dropped: database locked",
    "dropped: disk full",
    "dropped: input/output error",
    "dropped: log held by a reader",
    "dropped: no back-end",
    "dropped: no known report",
    "dropped: no session found",
    "dropped: not taken by the reader",
    "dropped: reader too slow",
    "dropped: service ending",
    "dropped: session released",
    "dropped: store closed",
    "dropped: test session",
    "dropped: too large",
    "dropped: transactions not allowed",
    "events dropped: the service ends",
    "events lost by the tracer",
    "failed",
    "failed: refused",
    "failed: the service ended",
    "files let go unfinished",
    "files that failed",
    "jobs discarded at the stop",
    "jobs that failed",
    "not acknowledged",
    "not recorded: no room",
    "not recorded: not started",
    "packets lost by the tracer",
    "refused: reporting disabled",
    "replies dropped: client gone",
    "replies dropped: second",
    "requests refused: client_history_megabytes",
    "requests refused: client_sessions",
    "requests refused: message too large",
    "requests refused: message_reporter_ids",
    "requests refused: not allowed",
    "requests refused: too many waiting",
    "requests refused: unknown interface",
    "requests refused: unknown method",
    "requests refused: unknown object",
    "requests refused: unsupported value",
    "requests refused: wrong signature",
    "skipped: late",
    "suppressed: first of two",
    "suppressed: nothing new",
    "suppressed: preferences not readable",
    "suppressed: redundant",
    "suppressed: repeated",
    "suppressed: sampled",
    "traces given up",
    "traces that failed",
};
constexpr std::array<std::string_view, 39> kProgress{
    "absent",
    "accepting paused: no descriptors",
    "acknowledged",
    "asked",
    "bytes received",
    "bytes released",
    "bytes sent",
    "bytes written",
    "carried out",
    "connections accepted",
    "connections ended",
    "delivered",
    "events delivered",
    "events read back",
    "files begun",
    "files written",
    "found",
    "handlers called",
    "held back",
    "merged with another",
    "messages ignored: no requests",
    "noticed",
    "passed on: single message",
    "posted",
    "published again",
    "readings asked for",
    "readings given",
    "received",
    "recorded",
    "replies given",
    "replies sent",
    "requests answered here",
    "requests delivered",
    "requests received",
    "sent",
    "stored",
    "traces saved",
    "traces started",
    "values taken",
};

TEST(CounterKindTest, TheCountersOfTheServiceHaveTheseKinds) {
  for (const std::string_view name : kLosses) {
    EXPECT_EQ(counterKind(name), CounterKind::kLoss) << name;
  }
  for (const std::string_view name : kProgress) {
    EXPECT_EQ(counterKind(name), CounterKind::kProgress) << name;
  }
}

TEST(CounterKindTest, ANameIsJudgedWithItsReason) {
  EXPECT_EQ(counterKind("dropped: disk full"), CounterKind::kLoss);
  EXPECT_EQ(counterKind("connections closed: timed out"), CounterKind::kLoss);
  EXPECT_EQ(counterKind("passed on: single message"), CounterKind::kProgress);
  EXPECT_EQ(counterKind("absent"), CounterKind::kProgress);
  EXPECT_EQ(counterKind("absent: refused or not readable"), CounterKind::kLoss);
}

TEST(CounterKindTest, ALabelOfAQueueDoesNotMatter) {
  EXPECT_EQ(counterKind("dropped files: jobs run"), CounterKind::kProgress);
  EXPECT_EQ(counterKind("com.tarno.halvox: jobs added"), CounterKind::kProgress);
}

// A name is not a loss because it contains such a word.
TEST(CounterKindTest, AnUnknownNameHasNoKind) {
  for (const std::string_view name : {"", "dropped", "frames not dropped",
                                      "received again after dropped: x", "delivered: late"}) {
    EXPECT_EQ(counterKind(name), std::nullopt) << name;
    EXPECT_FALSE(isLoss(name)) << name;
  }
}

}  // namespace
}  // namespace halvox::platform
