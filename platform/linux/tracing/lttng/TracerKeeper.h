#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include <sys/types.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/tracing/lttng/DaemonProcess.h"

namespace halvox::platform::linux_ {

// The program `halvox-tracer-keeper`, which outlives the service by the moments that it takes to
// end the tracer's daemon: however the service ends, the end of their pipe tells the keeper. It
// then destroys the service's sessions, and ends the daemon unless sessions of others are in it.
//
//   none --start() or keep()--> keeping --release()--> none
//
// The note file names the daemon, and its keeper holds a lock on it. Belongs to one thread at a
// time.
class TracerKeeper {
 public:
  struct Ward {
    std::filesystem::path noteFile{};
    std::string ownSessions{};  // how the names of the service's sessions start
  };

  TracerKeeper() = default;
  TracerKeeper(const TracerKeeper&) = delete;
  TracerKeeper& operator=(const TracerKeeper&) = delete;
  ~TracerKeeper() { release(); }

  // Starts a keeper, which starts a daemon; or tells why there is none. Waits until the daemon is
  // started, but not until it answers.
  [[nodiscard]] std::optional<std::string> start(const Ward& ward, DaemonProcess& daemon);
  // Starts a keeper of a daemon that runs already, or tells why there is none.
  [[nodiscard]] std::optional<std::string> keep(const Ward& ward, const DaemonProcess& daemon);
  // Waits at most that time until no keeper, of an earlier service, holds the note any more.
  static void awaitEarlier(const std::filesystem::path& noteFile, std::chrono::milliseconds within);
  // Has the keeper do what it does at the end of the service, and waits until it has. False when
  // there is none, or when it was killed.
  bool release();

 private:
  [[nodiscard]] std::optional<std::string> launch(const Ward& ward, DaemonProcess& daemon);

  pid_t pid_ = 0;
  UniqueFd whileWeLive_;  // the keeper sees its end
};

}  // namespace halvox::platform::linux_
