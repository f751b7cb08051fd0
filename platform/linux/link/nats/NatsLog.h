#pragma once

#include <string_view>

#include "platform/log.h"

namespace halvox::platform::linux_ {

inline constexpr std::string_view kNatsPiece = "link to NATS";

// The category of all lines about the link.
LogCategory& natsLogCategory();

}  // namespace halvox::platform::linux_
