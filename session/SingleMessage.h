#pragma once

#include <memory>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"
#include "session/ReplyCallbacks.h"
#include "session/ResourceAccount.h"
#include "session/SessionCounters.h"

namespace halvox {

// A message that goes to the real-time framework outside any of its sessions.
struct SingleMessage {
  platform::Message message;
  AudioEventCategory category;
  AudioEventType type;
  AudioServiceType serviceType;
};

// Sends the message one second from now on the background queue and then calls `reply` there, if
// there is one, with the framework's error or none. Until then the message is charged to `sender`;
// null charges nobody. The outcome is counted in `counters`, of which the message keeps a copy. A
// failure is logged too. Returns at once; any thread may call.
void submitSingleMessage(SingleMessage single, ErrorReply reply,
                         const std::shared_ptr<ResourceAccount>& sender,
                         const SessionCounters::SingleMessages& counters);

}  // namespace halvox
