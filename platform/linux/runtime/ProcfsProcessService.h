#pragma once

#include <functional>
#include <optional>
#include <string>
#include <utility>

#include "platform/process.h"

namespace halvox::platform::linux_ {

// Processes as /proc shows them.
//
// A name comes from the kernel, which cuts it to 15 bytes, perhaps within a character; bytes that
// are not UTF-8 become U+FFFD. A record that cannot be read, for whatever reason, counts as
// missing. Any thread may call. The platform owns it.
class ProcfsProcessService final : public ProcessService {
 public:
  // terminate() calls `beforeEnd`, which writes the log lines that are still queued. It must be
  // quick, because the process must end at once.
  explicit ProcfsProcessService(std::function<void()> beforeEnd = {})
      : beforeEnd_(std::move(beforeEnd)) {}

  [[nodiscard]] std::optional<ProcessRecord> processRecord(ProcessID pid) const override;
  [[nodiscard]] ProcessID ownProcessIdentifier() const override;
  // The name that the process was started with, without its directory; not cut to 15 bytes.
  [[nodiscard]] std::string ownProcessName() const override;
  [[noreturn]] void terminate(int exitStatus) override;

 private:
  const std::function<void()> beforeEnd_;
};

}  // namespace halvox::platform::linux_
