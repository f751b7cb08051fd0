#include "platform/fake/FakeLogService.h"

#include <algorithm>
#include <map>
#include <memory>
#include <utility>

namespace halvox::platform {

class FakeLogCategory final : public LogCategory {
 public:
  FakeLogCategory(std::string subsystem, std::string category)
      : LogCategory(LogLevel::kDebug),
        subsystem_(std::move(subsystem)),
        category_(std::move(category)) {}

  void setThreshold(LogLevel level) { threshold_.store(level, std::memory_order_relaxed); }
  void write(LogLevel level, std::string_view line) override;

 private:
  const std::string subsystem_;
  const std::string category_;
};

namespace {

// The categories, and the service that they write to now. Outlives the services.
struct Registry {
  // Recursive, because a handler of the journal may run jobs, and these log.
  std::recursive_mutex mutex;
  std::map<std::pair<std::string, std::string>, std::unique_ptr<FakeLogCategory>> categories;
  LogLevel level = LogLevel::kDebug;
  FakeLogService* receiver = nullptr;
};

Registry& registry() {
  // Never destroyed, because objects with static storage may still log.
  static auto* instance = new Registry;
  return *instance;
}

// Removes the prefix: the unit's name, a colon, the line number padded to five characters, and a
// space. The name is padded to 25 characters and contains no colon.
std::string_view withoutPrefix(std::string_view line) {
  constexpr std::size_t kLineWidth = 5;
  const std::size_t colon = line.find(':');
  if (colon == std::string_view::npos) return line;
  const std::size_t behindNumber = line.find_first_not_of("0123456789", colon + 1);
  if (behindNumber == std::string_view::npos) return {};
  const std::size_t width = std::max(kLineWidth, behindNumber - colon - 1);
  return line.substr(std::min(line.size(), colon + 1 + width + 1));
}

}  // namespace

void FakeLogCategory::write(LogLevel level, std::string_view line) {
  const std::lock_guard lock(registry().mutex);
  if (registry().receiver == nullptr) return;  // between two tests
  registry().receiver->record(
      {level, subsystem_, category_, std::string(line), std::string(withoutPrefix(line))});
}

FakeLogService::FakeLogService(Journal& journal) : journal_(journal) {
  {
    const std::lock_guard lock(registry().mutex);
    registry().receiver = this;
  }
  setLevel(LogLevel::kDebug);
}

FakeLogService::~FakeLogService() {
  const std::lock_guard lock(registry().mutex);
  if (registry().receiver == this) registry().receiver = nullptr;
}

void FakeLogService::setLevel(LogLevel level) {
  const std::lock_guard lock(registry().mutex);
  registry().level = level;
  for (const auto& [names, category] : registry().categories) category->setThreshold(level);
}

void FakeLogService::clear() {
  const std::lock_guard lock(mutex_);
  lines_.clear();
}

std::vector<FakeLogService::Line> FakeLogService::lines() const {
  const std::lock_guard lock(mutex_);
  return lines_;
}

std::vector<FakeLogService::Line> FakeLogService::lines(LogLevel level) const {
  std::vector<Line> result = lines();
  std::erase_if(result, [level](const Line& line) { return line.level != level; });
  return result;
}

std::vector<std::string> FakeLogService::texts() const {
  std::vector<std::string> result;
  for (Line& line : lines()) result.push_back(std::move(line.text));
  return result;
}

std::vector<std::string> FakeLogService::texts(LogLevel level) const {
  std::vector<std::string> result;
  for (Line& line : lines(level)) result.push_back(std::move(line.text));
  return result;
}

bool FakeLogService::containsText(std::string_view text) const {
  const std::lock_guard lock(mutex_);
  return std::ranges::find(lines_, text, &Line::text) != lines_.end();
}

LogCategory& FakeLogService::createCategory(std::string_view subsystem, std::string_view category) {
  const std::lock_guard lock(registry().mutex);
  auto& made = registry().categories[{std::string(subsystem), std::string(category)}];
  if (made == nullptr) {
    made = std::make_unique<FakeLogCategory>(std::string(subsystem), std::string(category));
    made->setThreshold(registry().level);
  }
  return *made;
}

void FakeLogService::record(Line line) {
  journal_.record(JournalKind::kLogLine, line.text);
  const std::lock_guard lock(mutex_);
  lines_.push_back(std::move(line));
}

}  // namespace halvox::platform
