#include "platform/linux/settings/TomlPreferenceService.h"

#include "platform/linux/settings/PreferenceFile.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kPiece = "preferences";

}  // namespace

TomlPreferenceService::TomlPreferenceService(const PreferenceReader& reader,
                                             StatisticsService& statistics)
    : reader_(reader),
      asked_(statistics.counter(kPiece, "asked")),
      found_(statistics.counter(kPiece, "found")),
      absent_(statistics.counter(kPiece, "absent")),
      unreadable_(statistics.counter(kPiece, "absent: refused or not readable")) {}

std::optional<Value> TomlPreferenceService::CFPreferencesCopyValue(
    std::string_view key, std::string_view applicationID, std::string_view userName) const {
  asked_.add();
  const auto values = reader_.read(userName, applicationID);
  if (!values.has_value()) {
    unreadable_.add();
    return std::nullopt;
  }
  const Value* value = values->find(key);
  (value == nullptr ? absent_ : found_).add();
  return value == nullptr ? std::nullopt : std::optional(*value);
}

std::optional<Value> TomlPreferenceService::suiteValue(std::string_view suiteName,
                                                       std::string_view key) const {
  return CFPreferencesCopyValue(key, suiteName, kPreferenceUser);
}

}  // namespace halvox::platform::linux_
