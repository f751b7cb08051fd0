#include "platform/linux/kdebug/LttngKdebugService.h"

#include <cstdlib>
#include <type_traits>
#include <utility>

#include "platform/linux/modules/Module.h"

namespace halvox::platform::linux_ {

Result<std::unique_ptr<KdebugService>> LttngKdebugService::load() {
  // LTTng would otherwise wait three seconds at the start for a session daemon that does not
  // answer.
  ::setenv("LTTNG_UST_REGISTER_TIMEOUT", "0", /*replace=*/0);
  auto loaded = loadEntryPoint<std::remove_pointer_t<Emit>>(
      {"halvox-kdebug-lttng.so", "halvox_kdebug_lttng_1"});
  if (!loaded) return std::move(loaded).error();
  return std::unique_ptr<KdebugService>(new LttngKdebugService(*loaded));
}

void LttngKdebugService::kdebug_trace(std::uint32_t code, std::uint64_t argument1,
                                      std::uint64_t argument2, std::uint64_t argument3,
                                      std::uint64_t argument4) {
  emit_(code, argument1, argument2, argument3, argument4);
}

}  // namespace halvox::platform::linux_
