#include "platform/linux/store/RecordKind.h"

namespace halvox::platform::linux_ {

std::string_view counterName(DropReason reason) {
  switch (reason) {
    case DropReason::kDiskFull:
      return "dropped: disk full";
    case DropReason::kLocked:
      return "dropped: database locked";
    case DropReason::kLogHeld:
      return "dropped: log held by a reader";
    case DropReason::kDamaged:
      return "dropped: database damaged";
    case DropReason::kInputOutput:
      return "dropped: input/output error";
    case DropReason::kTooLarge:
      return "dropped: too large";
    case DropReason::kClosed:
      return "dropped: store closed";
  }
  return {};
}

}  // namespace halvox::platform::linux_
