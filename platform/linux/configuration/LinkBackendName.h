#pragma once

#include "platform/linux/configuration/Configuration.h"

namespace halvox::platform::linux_ {

// Returns the word for a back-end in the setting link.backend.
[[nodiscard]] const char* linkBackendName(LinkBackend backend);

}  // namespace halvox::platform::linux_
