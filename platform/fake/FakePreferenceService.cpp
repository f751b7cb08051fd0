#include "platform/fake/FakePreferenceService.h"

#include <utility>

namespace halvox::platform {

void FakePreferenceService::set(std::string_view domain, std::string_view key, Value value) {
  const std::lock_guard lock(mutex_);
  values_.insert_or_assign({std::string(domain), std::string(key)}, std::move(value));
}

void FakePreferenceService::remove(std::string_view domain, std::string_view key) {
  const std::lock_guard lock(mutex_);
  values_.erase({std::string(domain), std::string(key)});
}

std::vector<FakePreferenceService::Read> FakePreferenceService::takeReads() {
  const std::lock_guard lock(mutex_);
  return std::exchange(reads_, {});
}

std::optional<Value> FakePreferenceService::CFPreferencesCopyValue(
    std::string_view key, std::string_view applicationID, std::string_view userName) const {
  const std::lock_guard lock(mutex_);
  reads_.push_back({std::string(userName), std::string(applicationID), std::string(key)});
  if (userName != kSuiteUser) return std::nullopt;
  const auto found = values_.find({std::string(applicationID), std::string(key)});
  if (found == values_.end()) return std::nullopt;
  return found->second;
}

std::optional<Value> FakePreferenceService::suiteValue(std::string_view suiteName,
                                                       std::string_view key) const {
  return CFPreferencesCopyValue(key, suiteName, kSuiteUser);
}

}  // namespace halvox::platform
