#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace halvox::platform {

using ProcessID = std::int32_t;

// What the platform knows of a running process.
struct ProcessRecord {
  ProcessID pid = 0;
  // At most 15 bytes as the kernel has it; each byte that is not UTF-8 is replaced by U+FFFD.
  std::string commandName;
};

// Look-ups of processes. Any thread may ask; an answer reads a small file and does not wait.
class ProcessService {
 public:
  virtual ~ProcessService() = default;

  // The record of a process, or none when there is no such process or it cannot be read.
  [[nodiscard]] virtual std::optional<ProcessRecord> processRecord(ProcessID pid) const = 0;
  [[nodiscard]] virtual ProcessID ownProcessIdentifier() const = 0;
  [[nodiscard]] virtual std::string ownProcessName() const = 0;
  // Ends the process at once, without running destructors or flushing anything.
  [[noreturn]] virtual void terminate(int exitStatus) = 0;
};

}  // namespace halvox::platform
