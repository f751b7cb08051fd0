#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace halvox::platform {

// The kernel's process ID. The kernel reuses it after the process has ended.
using ProcessID = std::int32_t;

// What the platform knows about a running process.
struct ProcessRecord {
  ProcessID pid = 0;
  // At most 15 bytes, as the kernel keeps it. Each byte that is not UTF-8 is replaced by U+FFFD,
  // because the name becomes part of messages, whose texts are UTF-8.
  std::string commandName;
};

// Information about processes. Any thread may call; a call reads a small file and does not wait.
// The composition root owns the service.
class ProcessService {
 public:
  virtual ~ProcessService() = default;

  // The record of a process, read at each call. None if there is no such process or it cannot be
  // read.
  [[nodiscard]] virtual std::optional<ProcessRecord> processRecord(ProcessID pid) const = 0;
  [[nodiscard]] virtual ProcessID ownProcessIdentifier() const = 0;
  [[nodiscard]] virtual std::string ownProcessName() const = 0;
  // Ends the process at once, without running destructors or flushing anything. Two features of the
  // service require such an end.
  [[noreturn]] virtual void terminate(int exitStatus) = 0;
};

}  // namespace halvox::platform
