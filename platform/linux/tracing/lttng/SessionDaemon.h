#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include "platform/linux/base/Result.h"
#include "platform/linux/tracing/lttng/DaemonProcess.h"
#include "platform/linux/tracing/lttng/TracerKeeper.h"

namespace halvox::platform::linux_ {

// The session daemon of LTTng if this service started it. Belongs to one thread at a time;
// LttngControl owns it.
//
//   not ours --start() or adopt()--> ours --end() or leave()--> not ours
//
// The daemon must not outlive the service, however the service ends, unless others use it. Its
// keeper (TracerKeeper) ensures that. A file names the process, so that a later service recognises
// a daemon that stayed because others used it. A process is signalled only if its start time is the
// one in the file.
class SessionDaemon {
 public:
  struct Limits {
    // A daemon takes about 0.4 s to start; the rest is a reserve for a busy machine.
    std::chrono::milliseconds answersWithin{10'000};
    std::chrono::milliseconds endsWithin{5'000};  // after SIGTERM; then it is killed
  };

  // The directory of the file must exist before the daemon is started.
  explicit SessionDaemon(std::filesystem::path noteFile) : SessionDaemon(std::move(noteFile), {}) {}
  SessionDaemon(std::filesystem::path noteFile, Limits limits)
      : noteFile_(std::move(noteFile)), limits_(limits) {}

  // Takes over the daemon that the file names if it still runs; deletes the file otherwise. First
  // waits for the keeper of an earlier service if that keeper still runs. `ownSessions` is the
  // prefix of our session names; it must not be empty, or sessions of others would match.
  void adopt(const std::string& ownSessions);
  [[nodiscard]] bool isNoted() const;
  // Ends our daemon if it no longer answers, starts another and waits until that one answers. If it
  // does not answer, ends it and fails.
  Result<void> start(const std::string& ownSessions);
  [[nodiscard]] bool isOurs() const { return process_.has_value(); }
  // Ends the daemon if it is ours, and waits until it has ended.
  void end();
  // Lets the keeper destroy our sessions and end the daemon, unless others use the daemon. Waits
  // until that is done. Afterwards the daemon is not ours.
  void leave();

 private:
  [[nodiscard]] std::chrono::milliseconds keeperEndsWithin() const {
    return limits_.answersWithin + 2 * limits_.endsWithin;
  }
  void forget();

  const std::filesystem::path noteFile_;
  const Limits limits_;
  std::string ownSessions_;
  std::optional<DaemonProcess> process_;
  TracerKeeper keeper_;
};

}  // namespace halvox::platform::linux_
