#pragma once

#include <sys/types.h>

#include "platform/process.h"

namespace halvox::platform::linux_ {

// A user ID that the kernel never assigns.
inline constexpr uid_t kUnknownUser = static_cast<uid_t>(-1);

// The process and user at the other end of a connection, as the kernel or the bus reports them.
// Never taken from a request.
struct PeerCredentials {
  ProcessID pid = 0;  // 0: unknown
  uid_t uid = kUnknownUser;
};

}  // namespace halvox::platform::linux_
