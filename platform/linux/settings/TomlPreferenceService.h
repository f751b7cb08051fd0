#pragma once

#include "platform/linux/settings/PreferenceReader.h"
#include "platform/preferences.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Preferences from TOML files, `<directory>/<user>/<domain>.toml`. Suites are domains of the user
// "mobile". Keeps nothing between calls: each call reads and parses the file. A cache would have to
// rely on time stamps, and two saves within one tick of the file system's clock have the same time
// stamp.
//
// Owned by the platform. Any thread may call; blocks on the disk. A file that cannot be read counts
// as absent; PreferenceReader logs why.
class TomlPreferenceService final : public PreferenceService {
 public:
  // Does not own its arguments, which must outlive it.
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
