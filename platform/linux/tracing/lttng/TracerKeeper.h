#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/tracing/lttng/DaemonProcess.h"

namespace halvox::platform::linux_ {

// Starts and releases the program `halvox-tracer-keeper`, which ends the tracer's daemon when the
// service has ended.
//
//   none --start() or keep()--> keeping --release()--> none
//
// However the service ends, the kernel closes its end of a pipe, and the keeper sees that. The
// keeper then destroys the service's sessions and ends the daemon unless others have sessions in
// it. PR_SET_PDEATHSIG would be simpler, but it depends on the thread that forked and cannot ask
// whether others use the daemon.
//
// The note file names the daemon, and its keeper holds a lock on the file. Belongs to one thread at
// a time; SessionDaemon owns it.
class TracerKeeper {
 public:
  struct Ward {
    std::filesystem::path noteFile{};
    std::string ownSessions{};  // the prefix of the service's session names
  };

  TracerKeeper() = default;
  TracerKeeper(const TracerKeeper&) = delete;
  TracerKeeper& operator=(const TracerKeeper&) = delete;
  ~TracerKeeper() { release(); }

  // Starts a keeper, which starts a daemon. Waits until the daemon has been started, but not until
  // it answers.
  Result<DaemonProcess> start(const Ward& ward) { return launch(ward, {}); }
  // Starts a keeper for a daemon that runs already.
  Result<DaemonProcess> keep(const Ward& ward, const DaemonProcess& daemon) {
    return launch(ward, daemon);
  }
  // Waits until no keeper of an earlier service holds the note, but no longer than `within`.
  static void awaitEarlier(const std::filesystem::path& noteFile, std::chrono::milliseconds within);
  // Lets the keeper do its work as at the end of the service, and waits until it has ended. Returns
  // false if there is no keeper or it was killed.
  bool release();

 private:
  // `daemon` has the process ID 0 if the keeper must start one.
  Result<DaemonProcess> launch(const Ward& ward, DaemonProcess daemon);

  std::optional<ChildProcess> keeper_;
  UniqueFd whileWeLive_;  // the keeper sees when this is closed
};

}  // namespace halvox::platform::linux_
