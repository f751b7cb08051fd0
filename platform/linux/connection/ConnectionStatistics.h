#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Why a request was answered with an error before any object saw it.
enum class Refusal : std::uint8_t {
  kUnknownObject,
  kUnknownInterface,
  kUnknownMethod,
  kWrongSignature,
  kUnsupportedValue,
  kHistoryLimit,
  kSessionLimit,
  kReporterIDLimit,
  kTooLarge,
  kTooManyWaiting,
  kNotAllowed,
};
// Counted from the last of them, so that two new ones cannot count as one.
inline constexpr std::size_t kRefusalKinds = static_cast<std::size_t>(Refusal::kNotAllowed) + 1;

// The refusal as the statistics name it.
std::string_view nameOf(Refusal refusal);

// The adapter's counters. They balance:
//   requests received = delivered + answered here + refused (by reason)
//   replies given     = sent + dropped (by reason)
// Bytes are those that went through the sockets, handshakes included. Any thread may count.
struct ConnectionStatistics {
  explicit ConnectionStatistics(StatisticsService& service);

  Counter& connectionsAccepted;
  Counter& connectionsRefused;
  Counter& connectionsEnded;
  Counter& connectionsTimedOut;
  Counter& connectionsMalformed;
  Counter& acceptPauses;
  Counter& requestsReceived;
  Counter& requestsDelivered;
  Counter& requestsAnsweredHere;
  Counter& messagesIgnored;
  Counter& repliesGiven;
  Counter& repliesSent;
  Counter& repliesDroppedSecond;
  Counter& repliesDroppedGone;
  Counter& bytesReceived;
  Counter& bytesSent;
  std::array<Counter*, kRefusalKinds> refused;
};

}  // namespace halvox::platform::linux_
