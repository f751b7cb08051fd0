#pragma once

#include <string>

#include "tracing/TraceData.h"

namespace halvox {

// Records one argument of each event with its code. Does not count as traced. No parameters file
// creates one so far; the type is part of the interface. Owner and thread are those of TraceData.
class TracePoint final : public TraceData {
 public:
  // `argumentIndex` is 1 to 4. Any other index finds nothing.
  TracePoint(std::string name, std::uint32_t code, std::int32_t argumentIndex)
      : TraceData(std::move(name)), code_(code), argumentIndex_(argumentIndex) {}

  void processTracepoints(const Session& session, const Events& events) override;

 private:
  const std::uint32_t code_;
  const std::int32_t argumentIndex_;
};

}  // namespace halvox
