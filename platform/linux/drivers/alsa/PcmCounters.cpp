#include "platform/linux/drivers/alsa/PcmCounters.h"

namespace halvox::platform::linux_ {

void PcmCounters::look(const PcmStatus& status, Clock::time_point now) {
  if (last_.has_value()) {
    // The kernel has no history of states. A state that began and ended between two readings is not
    // seen.
    states_[last_->state].residency +=
        std::chrono::duration_cast<std::chrono::microseconds>(now - lastTime_);
    if (last_->state != status.state) ++states_[status.state].transitions;
  }
  // A new stream has another owner or a lower pointer.
  const bool isNewStream =
      !last_.has_value() || last_->owner != status.owner || status.hardwareFrames < hardware_.last;
  count(hardware_, status.hardwareFrames, isNewStream);
  count(application_, status.applicationFrames, isNewStream);
  last_ = status;
  lastTime_ = now;
}

void PcmCounters::count(Pointer& pointer, std::uint64_t now, bool isNewStream) {
  const std::uint64_t before = isNewStream ? 0 : pointer.last;
  // An application may rewind its pointer. The frames that it then writes again are not counted a
  // second time.
  if (now < before) return;
  pointer.total += now - before;
  pointer.last = now;
}

}  // namespace halvox::platform::linux_
