#pragma once

#include <string_view>

#include "platform/log.h"

namespace halvox::platform::linux_ {

// The name of the piece in the back-end's statistics; see platform/statistics.h.
inline constexpr std::string_view kNatsPiece = "link to NATS";

// The log category of the NATS back-end.
LogCategory& natsLogCategory();

}  // namespace halvox::platform::linux_
