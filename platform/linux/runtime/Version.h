#pragma once

namespace halvox::platform::linux_ {

// The version that the service and its tools are of, such as "1.2.3".
[[nodiscard]] const char* halvoxVersion();

}  // namespace halvox::platform::linux_
