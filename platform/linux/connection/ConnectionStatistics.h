#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Why the adapter itself refused a request and did not deliver it.
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
// The number of enumerators. If you add an enumerator at the end, name it here.
inline constexpr std::size_t kRefusalKinds = static_cast<std::size_t>(Refusal::kNotAllowed) + 1;

// Returns the name of the refusal in the statistics.
std::string_view nameOf(Refusal refusal);

// The adapter's counters. They are looked up only once, and counting then costs one relaxed
// addition. They balance:
//   requests received = delivered + answered here + refused (by reason)
//   replies given     = sent + dropped (by reason)
// A request with a malformed body is received, but counted only by connectionsMalformed. Bytes are
// those on the sockets, including handshakes. Any thread may count. The statistics service owns the
// counters and must outlive this.
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
