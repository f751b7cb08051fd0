#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/process.h"

namespace halvox::platform {

// Thrown instead of ending the process.
struct FakeTermination {
  int exitStatus;
};

// Processes that the test makes; at first only this one exists. Any thread may call. FakePlatform
// owns it.
class FakeProcessService final : public ProcessService {
 public:
  static constexpr ProcessID kOwnPID = 4711;

  // Does not own the journal, which must outlive it.
  explicit FakeProcessService(Journal& journal) : journal_(journal) {}

  void addProcess(ProcessID pid, std::string_view commandName);
  void removeProcess(ProcessID pid);
  void setOwnName(std::string name);
  // Called before terminate() throws.
  void setTerminationHandler(std::function<void(int exitStatus)> handler);

  // The number of look-ups.
  [[nodiscard]] std::size_t lookUps() const;
  // The exit statuses given to terminate(), in order.
  [[nodiscard]] std::vector<int> terminations() const;

  [[nodiscard]] std::optional<ProcessRecord> processRecord(ProcessID pid) const override;
  [[nodiscard]] ProcessID ownProcessIdentifier() const override { return kOwnPID; }
  [[nodiscard]] std::string ownProcessName() const override;
  // Records the status and throws FakeTermination.
  [[noreturn]] void terminate(int exitStatus) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  std::map<ProcessID, std::string> names_;
  std::string ownName_ = "halvox-reportingd";
  std::function<void(int)> terminationHandler_;
  std::vector<int> terminations_;
  mutable std::size_t lookUps_ = 0;
};

}  // namespace halvox::platform
