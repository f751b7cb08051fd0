#include "platform/fake/FakeAnalyticsService.h"

#include <thread>
#include <utility>

namespace halvox::platform {

void FakeAnalyticsService::wantEverything() {
  const std::lock_guard lock(mutex_);
  wanted_.reset();
}

void FakeAnalyticsService::wantOnly(std::set<std::string, std::less<>> names) {
  const std::lock_guard lock(mutex_);
  wanted_ = std::move(names);
}

void FakeAnalyticsService::setBuilding(Building building) {
  const std::lock_guard lock(mutex_);
  building_ = building;
}

void FakeAnalyticsService::buildPayloads() const {
  for (std::size_t index = 0;; ++index) {
    AnalyticsPayloadBuilder builder;
    {
      const std::lock_guard lock(mutex_);
      if (index >= records_.size()) return;
      builder = std::exchange(records_[index].builder, nullptr);
    }
    if (!builder) continue;
    Dictionary payload =
        builder().dictionary();  // without the lock: a builder may call this service
    const std::lock_guard lock(mutex_);
    if (index < records_.size()) records_[index].event.payload = std::move(payload);
  }
}

void FakeAnalyticsService::clear() {
  std::vector<Record> dropped;  // destroyed without the lock: builders may own sessions
  const std::lock_guard lock(mutex_);
  dropped.swap(records_);
  tested_.clear();
}

std::vector<FakeAnalyticsService::Event> FakeAnalyticsService::events() const {
  if (buildsWhenRead()) buildPayloads();
  const std::lock_guard lock(mutex_);
  std::vector<Event> result;
  for (const Record& record : records_) result.push_back(record.event);
  return result;
}

std::vector<FakeAnalyticsService::Event> FakeAnalyticsService::events(std::string_view name) const {
  std::vector<Event> result = events();
  std::erase_if(result, [name](const Event& event) { return event.name != name; });
  return result;
}

std::vector<std::string> FakeAnalyticsService::sentNames() const {
  const std::lock_guard lock(mutex_);
  std::vector<std::string> names;
  for (const Record& record : records_) names.push_back(record.event.name);
  return names;
}

std::vector<std::string> FakeAnalyticsService::testedNames() const {
  const std::lock_guard lock(mutex_);
  return tested_;
}

bool FakeAnalyticsService::isAnalyticsEventUsed(std::string_view eventName) {
  journal_.record(JournalKind::kAnalyticsTest, eventName);
  const std::lock_guard lock(mutex_);
  tested_.emplace_back(eventName);
  return !wanted_.has_value() || wanted_->contains(eventName);
}

void FakeAnalyticsService::sendAnalyticsEventLazy(std::string_view eventName,
                                                  AnalyticsPayloadBuilder builder) {
  journal_.record(JournalKind::kAnalyticsEvent, eventName);
  bool buildsNow = false;
  {
    const std::lock_guard lock(mutex_);
    records_.push_back({{std::string(eventName), std::nullopt}, std::move(builder)});
    buildsNow = building_ == Building::kWhenSent;
  }
  if (buildsNow) std::thread([this] { buildPayloads(); }).join();
}

bool FakeAnalyticsService::buildsWhenRead() const {
  const std::lock_guard lock(mutex_);
  return building_ == Building::kWhenRead;
}

}  // namespace halvox::platform
