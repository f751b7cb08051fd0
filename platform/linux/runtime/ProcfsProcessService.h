#pragma once

#include <optional>
#include <string>

#include "platform/process.h"

namespace halvox::platform::linux_ {

// Processes as /proc shows them. Any thread may ask. A name comes from the kernel, which cuts it to
// 15 bytes, maybe within a character; what is then not UTF-8 becomes U+FFFD.
// A record that cannot be read, for whatever reason, is no record.
class ProcfsProcessService final : public ProcessService {
 public:
  [[nodiscard]] std::optional<ProcessRecord> processRecord(ProcessID pid) const override;
  [[nodiscard]] ProcessID ownProcessIdentifier() const override;
  // The name that the process was called by, without its folder; not cut to 15 bytes.
  [[nodiscard]] std::string ownProcessName() const override;
  [[noreturn]] void terminate(int exitStatus) override;
};

}  // namespace halvox::platform::linux_
