#pragma once

#include "platform/linux/configuration/Configuration.h"

namespace halvox::platform::linux_ {

// Returns the value of link.backend that selects this back-end.
[[nodiscard]] const char* linkBackendName(LinkBackend backend);

}  // namespace halvox::platform::linux_
