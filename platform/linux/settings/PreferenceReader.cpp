#include "platform/linux/settings/PreferenceReader.h"

#include <utility>
#include <variant>

#include <sys/stat.h>

#include "platform/linux/settings/PreferenceFile.h"
#include "platform/linux/settings/SettingNames.h"
#include "platform/linux/settings/SettingsLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(settingsCategory, "PreferenceReader");
// With more entries, all are forgotten, and a mistake may be logged a second time.
constexpr std::size_t kMostTold = 64;

// Identifies the state of a file, so that a file saved again with the same mistake is logged again.
std::string stateOf(const std::filesystem::path& file) {
  struct stat status {};
  if (::stat(file.c_str(), &status) != 0) return {};
  return std::to_string(status.st_ino) + " " + std::to_string(status.st_mtim.tv_sec) + "." +
         std::to_string(status.st_mtim.tv_nsec);
}

}  // namespace

std::optional<Dictionary> PreferenceReader::read(std::string_view user,
                                                 std::string_view domain) const {
  const auto file = preferencePath(directory_, user, domain);
  if (!file.has_value()) {
    const std::string names = "user " + shownName(user) + ", domain " + shownName(domain);
    tell(names, "", names + ": refused, these cannot name a file of preferences");
    return std::nullopt;
  }
  auto content = readPreferences(*file);
  if (const auto* error = std::get_if<PreferenceFileError>(&content)) {
    tell(file->native(), error->description + stateOf(*file),
         error->description + "; until it is mended, its values count as absent");
    return std::nullopt;
  }
  tellMended(file->native());
  return std::get<Dictionary>(std::move(content));
}

void PreferenceReader::tell(const std::string& subject, const std::string& state,
                            const std::string& line) const {
  {
    const MutexLock held(mutex_);
    const auto known = told_.find(subject);
    if (known != told_.end() && known->second == state) return;
    if (told_.size() >= kMostTold) told_.clear();
    told_.insert_or_assign(subject, state);
  }
  kLog.error("", line);
}

void PreferenceReader::tellMended(const std::string& file) const {
  {
    const MutexLock held(mutex_);
    if (told_.erase(file) == 0) return;
  }
  kLog.notice("", file, ": the preferences can be read again");
}

}  // namespace halvox::platform::linux_
