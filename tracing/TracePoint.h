#pragma once

#include <string>

#include "tracing/TraceData.h"

namespace halvox {

// Measures an argument of each event with one code. Its values are not counted as traced.
class TracePoint final : public TraceData {
 public:
  // `argumentIndex` is 1 to 4; with any other nothing is ever found.
  TracePoint(std::string name, std::uint32_t code, std::int32_t argumentIndex)
      : TraceData(std::move(name)), code_(code), argumentIndex_(argumentIndex) {}

  void processTracepoints(const Session& session, const Events& events) override;

 private:
  const std::uint32_t code_;
  const std::int32_t argumentIndex_;
};

}  // namespace halvox
