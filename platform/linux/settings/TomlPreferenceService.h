#pragma once

#include "platform/linux/settings/PreferenceReader.h"
#include "platform/preferences.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Preferences in TOML files, `<directory>/<user>/<domain>.toml`; suites are domains of the user
// "mobile". Nothing is kept between calls: each one reads and parses the file, so that no change
// can be missed whatever the clock of the file system does. Any thread may call.
class TomlPreferenceService final : public PreferenceService {
 public:
  // Does not own these, which must outlive it.
  TomlPreferenceService(const PreferenceReader& reader, StatisticsService& statistics);

  [[nodiscard]] std::optional<Value> CFPreferencesCopyValue(
      std::string_view key, std::string_view applicationID,
      std::string_view userName) const override;
  [[nodiscard]] std::optional<Value> suiteValue(std::string_view suiteName,
                                                std::string_view key) const override;

 private:
  const PreferenceReader& reader_;
  // asked = found + absent + unreadable
  Counter& asked_;
  Counter& found_;
  Counter& absent_;
  Counter& unreadable_;
};

}  // namespace halvox::platform::linux_
