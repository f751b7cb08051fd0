#include "platform/linux/runtime/Version.h"

namespace halvox::platform::linux_ {

const char* halvoxVersion() { return HALVOX_VERSION; }

}  // namespace halvox::platform::linux_
