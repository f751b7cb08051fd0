#include "platform/fake/FakeProcessService.h"

#include <algorithm>
#include <utility>

namespace halvox::platform {

void FakeProcessService::addProcess(ProcessID pid, std::string commandName) {
  constexpr std::size_t kLongestName = 15;  // as the port promises
  commandName.resize(std::min(commandName.size(), kLongestName));
  const std::lock_guard lock(mutex_);
  names_.insert_or_assign(pid, std::move(commandName));
}

void FakeProcessService::removeProcess(ProcessID pid) {
  const std::lock_guard lock(mutex_);
  names_.erase(pid);
}

void FakeProcessService::setOwnName(std::string name) {
  const std::lock_guard lock(mutex_);
  ownName_ = std::move(name);
}

void FakeProcessService::setTerminationHandler(std::function<void(int)> handler) {
  const std::lock_guard lock(mutex_);
  terminationHandler_ = std::move(handler);
}

std::size_t FakeProcessService::lookUps() const {
  const std::lock_guard lock(mutex_);
  return lookUps_;
}

std::vector<int> FakeProcessService::terminations() const {
  const std::lock_guard lock(mutex_);
  return terminations_;
}

std::optional<ProcessRecord> FakeProcessService::processRecord(ProcessID pid) const {
  const std::lock_guard lock(mutex_);
  ++lookUps_;
  const auto name = names_.find(pid);
  if (name == names_.end()) return std::nullopt;
  return ProcessRecord{pid, name->second};
}

std::string FakeProcessService::ownProcessName() const {
  const std::lock_guard lock(mutex_);
  return ownName_;
}

void FakeProcessService::terminate(int exitStatus) {
  journal_.record(JournalKind::kTermination, std::to_string(exitStatus));
  std::function<void(int)> handler;
  {
    const std::lock_guard lock(mutex_);
    terminations_.push_back(exitStatus);
    handler = terminationHandler_;
  }
  if (handler) handler(exitStatus);
  throw FakeTermination{exitStatus};
}

}  // namespace halvox::platform
