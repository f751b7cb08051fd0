#pragma once

#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/Mutex.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// Reads preference files for the service and tells in the log what is wrong with them: once for
// each mistake and state of a file, however often it is read, and once more when it is mended. Any
// thread may call; reads a file each time.
class PreferenceReader {
 public:
  explicit PreferenceReader(std::filesystem::path directory) : directory_(std::move(directory)) {}
  PreferenceReader(const PreferenceReader&) = delete;
  PreferenceReader& operator=(const PreferenceReader&) = delete;

  [[nodiscard]] const std::filesystem::path& directory() const { return directory_; }
  // The values of a domain, empty when it has no file; none when a name is refused or the file
  // cannot be read.
  [[nodiscard]] std::optional<Dictionary> read(std::string_view user, std::string_view domain) const
      HALVOX_EXCLUDES(mutex_);

 private:
  void tell(const std::string& subject, const std::string& state, const std::string& line) const
      HALVOX_EXCLUDES(mutex_);
  void tellMended(const std::string& file) const HALVOX_EXCLUDES(mutex_);

  const std::filesystem::path directory_;
  mutable Mutex mutex_;
  // What was told last of each file or refused name that is wrong. Bounded.
  mutable std::map<std::string, std::string, std::less<>> told_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
