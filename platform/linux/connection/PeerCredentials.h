#pragma once

#include <sys/types.h>

#include "platform/process.h"

namespace halvox::platform::linux_ {

// The number that no user has.
inline constexpr uid_t kUnknownUser = static_cast<uid_t>(-1);

// Who is at the other end of a connection, as the kernel or the bus says; never taken from a
// request.
struct PeerCredentials {
  ProcessID pid = 0;  // 0: unknown
  uid_t uid = kUnknownUser;
};

}  // namespace halvox::platform::linux_
