#pragma once

#include <functional>
#include <optional>
#include <string>
#include <utility>

#include "platform/process.h"

namespace halvox::platform::linux_ {

// Processes as /proc shows them. Any thread may ask. A name comes from the kernel, which cuts it to
// 15 bytes, maybe within a character; what is then not UTF-8 becomes U+FFFD.
// A record that cannot be read, for whatever reason, is no record.
class ProcfsProcessService final : public ProcessService {
 public:
  // `beforeEnd` is called by terminate(), to write what was logged before the end. It must be
  // quick.
  explicit ProcfsProcessService(std::function<void()> beforeEnd = {})
      : beforeEnd_(std::move(beforeEnd)) {}

  [[nodiscard]] std::optional<ProcessRecord> processRecord(ProcessID pid) const override;
  [[nodiscard]] ProcessID ownProcessIdentifier() const override;
  // The name that the process was called by, without its folder; not cut to 15 bytes.
  [[nodiscard]] std::string ownProcessName() const override;
  [[noreturn]] void terminate(int exitStatus) override;

 private:
  const std::function<void()> beforeEnd_;
};

}  // namespace halvox::platform::linux_
