#include "tracing/TracePoint.h"

#include <array>

namespace halvox {

void TracePoint::processTracepoints(const Session& /*session*/, const Events& events) {
  using Argument = std::uint64_t platform::trace_point::*;
  constexpr std::array<Argument, 4> kArguments{
      &platform::trace_point::arg1, &platform::trace_point::arg2, &platform::trace_point::arg3,
      &platform::trace_point::arg4};
  // The index comes from outside; an argument that does not exist has no values.
  if (argumentIndex_ < 1 || argumentIndex_ > static_cast<std::int32_t>(kArguments.size())) return;
  const Argument argument = kArguments[static_cast<std::size_t>(argumentIndex_ - 1)];
  for (const platform::trace_point& event : events) {
    // The count of traced events stays as it is; this is required.
    if (event.debugid == code_) addResult(event.*argument);
  }
}

}  // namespace halvox
