#include "platform/fake/FakeProcessService.h"

#include <algorithm>
#include <string_view>
#include <utility>

namespace halvox::platform {
namespace {

// The length of the UTF-8 character at the start; 0 if no character begins there. Overlong forms
// and surrogates count as characters; no test needs them.
std::size_t characterLength(std::string_view text) {
  const auto byteAt = [text](std::size_t index) { return static_cast<unsigned char>(text[index]); };
  const unsigned char first = byteAt(0);
  if (first < 0x80) return 1;
  const std::size_t length = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4 || text.size() < length) return 0;
  for (std::size_t index = 1; index < length; ++index) {
    if ((byteAt(index) & 0xC0) != 0x80) return 0;
  }
  return length;
}

// Replaces bytes that are not UTF-8, as ProcessRecord promises.
std::string recordedName(std::string_view name) {
  constexpr std::size_t kLongestName = 15;
  name = name.substr(0, kLongestName);
  std::string result;
  while (!name.empty()) {
    const std::size_t length = characterLength(name);
    result += length == 0 ? "\xEF\xBF\xBD" : name.substr(0, length);
    name.remove_prefix(std::max<std::size_t>(length, 1));
  }
  return result;
}

}  // namespace

void FakeProcessService::addProcess(ProcessID pid, std::string_view commandName) {
  const std::lock_guard lock(mutex_);
  names_.insert_or_assign(pid, recordedName(commandName));
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
