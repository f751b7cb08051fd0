#pragma once

#include <atomic>
#include <functional>
#include <optional>
#include <utility>

#include "platform/value.h"

namespace halvox {

// Passes the framework's answer about back-ends to one start of a session's link, and keeps the log
// of the link in order: the answer is reported only after the start job has logged that it waits.
// If the framework answers earlier, this object keeps the answer and reports it from a queue of its
// own, because the link's queue is about to wait for the report.
//
//   new --awaitAnswer()--> waiting  --answer()-->      reported on the framework's thread
//   new --answer()-->      answered --awaitAnswer()--> reported by a job of its own queue
//
// Shared by the start job and the framework's callback, which may come late or never. Neither
// thread waits for the other. No operation fails.
class LinkDiscovery {
 public:
  // None: the framework found no back-ends.
  using Backends = std::optional<platform::Array>;
  using Report = std::function<void(const Backends&)>;

  // `report` is called at most once, never on the link's queue. `report` must not keep the session
  // alive, because the framework may hold this object for ever.
  explicit LinkDiscovery(Report report) : report_(std::move(report)) {}

  // Call once, from the start job, after it has logged that it waits.
  void awaitAnswer();
  // Call once, on the framework's thread.
  void answer(const Backends& backends);

 private:
  // False in the first call of awaitAnswer() or answer(), true in the second one.
  bool isSecondCall() { return wasCalled_.exchange(true, std::memory_order_acq_rel); }

  const Report report_;
  Backends answered_;  // written by answer(); read by awaitAnswer() if that is the second call
  std::atomic<bool> wasCalled_{false};  // orders answered_ before its use by awaitAnswer()
};

}  // namespace halvox
