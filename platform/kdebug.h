#pragma once

#include <cstdint>

namespace halvox::platform {

// Trace points: marks in the system trace that cost next to nothing while nobody traces.
class KdebugService {
 public:
  virtual ~KdebugService() = default;

  // Emits one mark. May be called from any thread; never blocks.
  virtual void kdebug_trace(std::uint32_t code, std::uint64_t argument1, std::uint64_t argument2,
                            std::uint64_t argument3, std::uint64_t argument4) = 0;
};

}  // namespace halvox::platform
