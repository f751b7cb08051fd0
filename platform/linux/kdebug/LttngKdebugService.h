#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <variant>

#include "platform/kdebug.h"

namespace halvox::platform::linux_ {

// Trace points that go nowhere.
class NoKdebugService final : public KdebugService {
 public:
  void kdebug_trace(std::uint32_t /*code*/, std::uint64_t /*argument1*/,
                    std::uint64_t /*argument2*/, std::uint64_t /*argument3*/,
                    std::uint64_t /*argument4*/) override {}
};

// Trace points as LTTng events "halvox:kdebug" with the fields code and arg1 to arg4.
//
// The provider is a module that is loaded here. LTTng then has two threads in the process, which
// sleep until a session daemon starts: they cost no wake-up, and a daemon that starts later finds
// the service too. Loading does not wait for a daemon, not even for one that hangs.
// The module stays loaded to the end of the process, as its threads need it.
class LttngKdebugService final : public KdebugService {
 public:
  // The service, or in words why the provider cannot be loaded. Call it before other threads start:
  // it may set an environment variable.
  static std::variant<std::unique_ptr<KdebugService>, std::string> load(
      const std::filesystem::path& module);
  // Where the provider is: beside the program, else where it is installed. Empty when this build
  // has none.
  static std::filesystem::path modulePath();

  void kdebug_trace(std::uint32_t code, std::uint64_t argument1, std::uint64_t argument2,
                    std::uint64_t argument3, std::uint64_t argument4) override;

 private:
  using Emit = void (*)(std::uint32_t, std::uint64_t, std::uint64_t, std::uint64_t, std::uint64_t);
  explicit LttngKdebugService(Emit emit) : emit_(emit) {}

  const Emit emit_;
};

}  // namespace halvox::platform::linux_
