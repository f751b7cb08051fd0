#include "session/SessionStop.h"

#include <utility>

#include "session/HVReportingSession.h"

namespace halvox {

// Releases the session, which its owner may have dropped. From here on, the event is charged to
// the same account while it waits for the link.
void SessionStop::finish() {
  std::exchange(session_, nullptr)->endStop(run_);
  charge_ = {};
}

}  // namespace halvox
