#pragma once

#include <string_view>

#include "analysis/RecordSource.h"

namespace halvox::analysis {

// What the two events of a message have in common: the one under the name that all services share,
// and its twin under the name of its service type. The texts belong to the caller.
struct TwinContent {
  std::string_view category;
  std::string_view type;
  std::string_view payload;
};

// Whether `next` is the twin of an event with that content under the shared name. The store has the
// two events directly after each other: `next` must be the next event.
[[nodiscard]] bool isTwin(const TwinContent& first, const Record& next);

}  // namespace halvox::analysis
