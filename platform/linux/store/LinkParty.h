#pragma once

#include <cstdint>
#include <string>

namespace halvox::platform::linux_ {

// The sender of link messages. All messages of one session share one LinkParty.
struct LinkParty {
  std::int64_t sessionID = 0;
  std::string clientName;
  std::string serviceName;
};

}  // namespace halvox::platform::linux_
