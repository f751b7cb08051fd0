#pragma once

#include <cstdint>

namespace halvox::platform {

// Trace points: marks in the system trace that cost almost nothing while no tracer records them.
//
// Any thread may call. A mark that no tracer records is lost silently. The composition root owns
// the service.
class KdebugService {
 public:
  virtual ~KdebugService() = default;

  // Emits one mark with four arguments. Never blocks. The spelling is part of the interface.
  virtual void kdebug_trace(std::uint32_t code, std::uint64_t argument1, std::uint64_t argument2,
                            std::uint64_t argument3, std::uint64_t argument4) = 0;
};

}  // namespace halvox::platform
