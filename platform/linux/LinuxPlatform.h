#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/linux/base/Result.h"
#include "platform/object_log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

struct Configuration;
struct LinuxAdapters;

// All Linux adapters of one process, made from its configuration. Belongs to the main thread.
// The adapters themselves are named in LinuxAdapters.h, which only the sources read: `main` does
// not depend on any library that an adapter is built over.
//
//   made --open()--> serving --close()--> closed
class LinuxPlatform {
 public:
  // Starts the threads of the log and of the queues; nothing outside the process is touched yet.
  explicit LinuxPlatform(const Configuration& configuration);
  LinuxPlatform(const LinuxPlatform&) = delete;
  LinuxPlatform& operator=(const LinuxPlatform&) = delete;
  ~LinuxPlatform();

  [[nodiscard]] Services services();
  // The service manager's watchdog watches the queues of that label, and the main thread. Call it
  // before the listener's resume().
  void watchQueue(std::string label);
  // Opens the store, then the socket, so that everything that is accepted can be stored.
  // The services must be installed. The code of a failure is the exit status of the process.
  Result<void, int> open();
  // Ends the queues, writes the records that wait for the store, and logs the statistics. Returns
  // false when a job or the link does not end. The process must then end without destroying
  // anything.
  [[nodiscard]] bool close();

 private:
  // Which counters to log: those above 0, or all.
  enum class Counters : std::uint8_t { kCounted, kAll };

  void logStart() const;
  void logStatistics(LogLevel level, Counters counters) const;

  const std::unique_ptr<LinuxAdapters> adapters_;
  const ObjectLog log_;
};

}  // namespace halvox::platform::linux_
