#include "platform/linux/settings/PreferenceReader.h"

#include <utility>
#include <variant>

#include <sys/stat.h>

#include "platform/linux/settings/PreferenceFile.h"
#include "platform/linux/settings/SettingNames.h"
#include "platform/linux/settings/SettingsLog.h"

namespace halvox::platform::linux_ {
namespace {

// When there are more entries, all are removed, and a mistake may be logged a second time.
constexpr std::size_t kMostLogged = 64;

// Identifies the state of a file, so that a file saved again with the same mistake is logged again.
std::string stateOf(const std::filesystem::path& file) {
  struct stat status {};
  if (::stat(file.c_str(), &status) != 0) return {};
  return std::to_string(status.st_ino) + " " + std::to_string(status.st_mtim.tv_sec) + "." +
         std::to_string(status.st_mtim.tv_nsec);
}

}  // namespace

PreferenceReader::PreferenceReader(std::filesystem::path directory, LogService& log)
    : directory_(std::move(directory)), log_(settingsLog(log, "PreferenceReader")) {}

std::optional<Dictionary> PreferenceReader::read(std::string_view user,
                                                 std::string_view domain) const {
  const auto file = preferencePath(directory_, user, domain);
  if (!file.has_value()) {
    const std::string names = "user " + shownName(user) + ", domain " + shownName(domain);
    logOnce(names, "", names + ": expected names that a file can have; the values count as absent");
    return std::nullopt;
  }
  auto content = readPreferences(*file);
  if (!content) {
    const std::string& message = content.error().message;
    logOnce(file->native(), message + stateOf(*file),
            message + "; until it is fixed, its values count as absent");
    return std::nullopt;
  }
  logFixed(file->native());
  return *std::move(content);
}

void PreferenceReader::logOnce(const std::string& subject, const std::string& state,
                               const std::string& line) const {
  {
    const MutexLock held(mutex_);
    const auto known = logged_.find(subject);
    if (known != logged_.end() && known->second == state) return;
    if (logged_.size() >= kMostLogged) logged_.clear();
    logged_.insert_or_assign(subject, state);
  }
  log_.error("", line);
}

void PreferenceReader::logFixed(const std::string& file) const {
  {
    const MutexLock held(mutex_);
    if (logged_.erase(file) == 0) return;
  }
  log_.notice("", file, ": the preferences can be read again; using their values");
}

}  // namespace halvox::platform::linux_
