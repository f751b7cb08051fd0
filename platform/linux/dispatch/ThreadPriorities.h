#pragma once

#include "platform/dispatch.h"
#include "platform/linux/base/ThreadSetup.h"

namespace halvox::platform::linux_ {

// Returns the priority of a thread that runs jobs of this quality of service.
[[nodiscard]] constexpr ThreadPriority priorityFor(QualityOfService quality) {
  switch (quality) {
    case QualityOfService::kUserInteractive:
      return ThreadPriority::kNormal;
    case QualityOfService::kUtility:
      return ThreadPriority::kUtility;
    case QualityOfService::kBackground:
      return ThreadPriority::kBackground;
  }
  return ThreadPriority::kNormal;
}

}  // namespace halvox::platform::linux_
