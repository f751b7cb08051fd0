#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include "platform/linux/tracing/lttng/DaemonProcess.h"
#include "platform/linux/tracing/lttng/TracerKeeper.h"

namespace halvox::platform::linux_ {

// The session daemon of LTTng, when it was started by us. Belongs to one thread at a time.
//
// It ends with the service, however that ends, unless sessions of others are in it: its keeper sees
// to that. A file tells which process it is, so that a service that starts later knows a daemon
// that others used. A process is signalled only while its start time is the one that was noted.
class SessionDaemon {
 public:
  struct Limits {
    std::chrono::milliseconds answersWithin{10'000};
    std::chrono::milliseconds endsWithin{5'000};  // of a signal; then it is killed
  };

  // The file is in a directory that exists before the daemon is started.
  explicit SessionDaemon(std::filesystem::path noteFile) : SessionDaemon(std::move(noteFile), {}) {}
  SessionDaemon(std::filesystem::path noteFile, Limits limits)
      : noteFile_(std::move(noteFile)), limits_(limits) {}

  // Takes over the daemon that the file names, if it still runs; otherwise the file goes. Waits for
  // the keeper of an earlier service that is still at work. Our sessions have names that start with
  // `ownSessions`, which is not empty.
  void adopt(const std::string& ownSessions);
  [[nodiscard]] bool isNoted() const;
  // Ends the daemon that was ours and does not answer any more, starts another and waits until it
  // answers; or ends it and tells why not.
  [[nodiscard]] std::optional<std::string> start(const std::string& ownSessions);
  [[nodiscard]] bool isOurs() const { return process_.has_value(); }
  // Ends the daemon, if it is ours, and waits until it is gone.
  void end();
  // Has our sessions destroyed, and the daemon ended unless sessions of others are in it. Waits
  // until that is done. The daemon is not ours any more.
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
