#pragma once

#include <cstdint>

#include "platform/kdebug.h"
#include "platform/services.h"

namespace halvox {

// The trace points of requests and sessions. Tools match the codes.
enum class ReportingTracePoint : std::uint32_t {
  kCreateRequest = 0x21044814,
  kStartRequest = 0x21044818,
  kStopRequest = 0x2104481C,
  kDestroyRequest = 0x21044820,
  kSendRequest = 0x21044824,
  kSessionCreated = 0x21044828,
  kSessionStarted = 0x2104482C,
  kSessionStopped = 0x21044830,
  kSessionDestroyed = 0x21044834,
  kMessageSent = 0x21044838,
};

// Emits the point with four arguments of 0, which is required.
inline void emitTracePoint(ReportingTracePoint point) {
  platform::kdebug().kdebug_trace(static_cast<std::uint32_t>(point), 0, 0, 0, 0);
}

}  // namespace halvox
