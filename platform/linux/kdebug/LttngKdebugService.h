#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/kdebug.h"
#include "platform/linux/base/Result.h"

namespace halvox::platform::linux_ {

// Discards trace points. For a service that is not traced, and for a build or a machine without
// LTTng. Any thread may call.
class NoKdebugService final : public KdebugService {
 public:
  void kdebug_trace(std::uint32_t /*code*/, std::uint64_t /*argument1*/,
                    std::uint64_t /*argument2*/, std::uint64_t /*argument3*/,
                    std::uint64_t /*argument4*/) override {}
};

// Emits trace points as LTTng events "halvox:kdebug" with the fields code and arg1 to arg4.
//
// The LTTng provider is a module that is loaded at run time. LTTng then has two threads in the
// process. They sleep until a session daemon starts and cause no wake-ups. A daemon that starts
// later also finds the service. Loading does not wait for a daemon, not even for one that hangs.
//
// Any thread may call. The platform owns it. The module stays loaded until the process ends,
// because LTTng's threads need it. If it cannot be loaded, the platform logs that and uses
// NoKdebugService.
class LttngKdebugService final : public KdebugService {
 public:
  // The service, or the reason why its module cannot be loaded. Call it before other threads start,
  // because it may set an environment variable, which is not thread-safe.
  static Result<std::unique_ptr<KdebugService>> load();

  void kdebug_trace(std::uint32_t code, std::uint64_t argument1, std::uint64_t argument2,
                    std::uint64_t argument3, std::uint64_t argument4) override;

 private:
  using Emit = void (*)(std::uint32_t, std::uint64_t, std::uint64_t, std::uint64_t, std::uint64_t);
  explicit LttngKdebugService(Emit emit) : emit_(emit) {}

  const Emit emit_;
};

}  // namespace halvox::platform::linux_
