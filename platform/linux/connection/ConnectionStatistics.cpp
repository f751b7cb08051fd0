#include "platform/linux/connection/ConnectionStatistics.h"

#include <string>

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kPiece = "connection";

}  // namespace

std::string_view nameOf(Refusal refusal) {
  switch (refusal) {
    case Refusal::kUnknownObject:
      return "unknown object";
    case Refusal::kUnknownInterface:
      return "unknown interface";
    case Refusal::kUnknownMethod:
      return "unknown method";
    case Refusal::kWrongSignature:
      return "wrong signature";
    case Refusal::kUnsupportedValue:
      return "unsupported value";
    case Refusal::kHistoryLimit:
      return "client_history_megabytes";
    case Refusal::kSessionLimit:
      return "client_sessions";
    case Refusal::kReporterIDLimit:
      return "message_reporter_ids";
    case Refusal::kTooLarge:
      return "message too large";
    case Refusal::kTooManyWaiting:
      return "too many waiting";
    case Refusal::kNotAllowed:
      return "not allowed";
  }
  return "unknown";
}

ConnectionStatistics::ConnectionStatistics(StatisticsService& service)
    : connectionsAccepted(service.counter(kPiece, "connections accepted")),
      connectionsRefused(service.counter(kPiece, "connections refused")),
      connectionsEnded(service.counter(kPiece, "connections ended")),
      connectionsTimedOut(service.counter(kPiece, "connections closed: timed out")),
      connectionsMalformed(service.counter(kPiece, "connections closed: malformed")),
      acceptPauses(service.counter(kPiece, "accepting paused: no descriptors")),
      requestsReceived(service.counter(kPiece, "requests received")),
      requestsDelivered(service.counter(kPiece, "requests delivered")),
      requestsAnsweredHere(service.counter(kPiece, "requests answered here")),
      messagesIgnored(service.counter(kPiece, "messages ignored: no requests")),
      repliesGiven(service.counter(kPiece, "replies given")),
      repliesSent(service.counter(kPiece, "replies sent")),
      repliesDroppedSecond(service.counter(kPiece, "replies dropped: second")),
      repliesDroppedGone(service.counter(kPiece, "replies dropped: client gone")),
      bytesReceived(service.counter(kPiece, "bytes received")),
      bytesSent(service.counter(kPiece, "bytes sent")),
      refused{} {
  for (std::size_t kind = 0; kind < kRefusalKinds; ++kind) {
    const std::string name = "requests refused: " + std::string(nameOf(static_cast<Refusal>(kind)));
    refused[kind] = &service.counter(kPiece, name);
  }
}

}  // namespace halvox::platform::linux_
