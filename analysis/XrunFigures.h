#pragma once

#include <cstdint>
#include <string_view>

#include "analysis/Payload.h"

namespace halvox::analysis {

// Whether a message of that type reports an xrun. Every view of the records asks this function, so
// that all of them count the same messages.
[[nodiscard]] bool isXrun(std::string_view type, const Payload& payload);

// How much a message says was lost. The numbers come from a client, which may send any: they are
// limited, so that sums of many stay finite. Reporters of earlier versions send the length in
// whole seconds only.
struct XrunFigures {
  double milliseconds = 0;         // at most one day
  std::uint64_t missedCycles = 0;  // at most 2^40
};
[[nodiscard]] XrunFigures xrunFigures(const Payload& payload);

}  // namespace halvox::analysis
