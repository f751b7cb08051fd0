#pragma once

namespace halvox::platform::linux_ {

// The version of the service and its tools, such as "1.2.3". All of them use this constant, so that
// they agree.
[[nodiscard]] const char* halvoxVersion();

}  // namespace halvox::platform::linux_
