#pragma once

#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/base/Mutex.h"
#include "platform/object_log.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// Reads preference files for the service, and logs what is wrong with them.
//
// A mistake is logged once for each state of the file, however often the file is read, because
// clients trigger the reads. That a file is fixed is also logged once. Owned by the platform. Any
// thread may call. Each call reads the file and blocks on the disk.
class PreferenceReader {
 public:
  // `log` must outlive the reader.
  PreferenceReader(std::filesystem::path directory, LogService& log);
  PreferenceReader(const PreferenceReader&) = delete;
  PreferenceReader& operator=(const PreferenceReader&) = delete;

  [[nodiscard]] const std::filesystem::path& directory() const { return directory_; }
  // Returns the values of a domain; empty when the domain has no file. Returns std::nullopt, after
  // logging, when a name is not usable or the file cannot be read.
  [[nodiscard]] std::optional<Dictionary> read(std::string_view user, std::string_view domain) const
      HALVOX_EXCLUDES(mutex_);

 private:
  void logOnce(const std::string& subject, const std::string& state, const std::string& line) const
      HALVOX_EXCLUDES(mutex_);
  void logFixed(const std::string& file) const HALVOX_EXCLUDES(mutex_);

  const std::filesystem::path directory_;
  const ObjectLog log_;
  mutable Mutex mutex_;
  // What was logged last about each bad file or name. Bounded, because clients choose names.
  mutable std::map<std::string, std::string, std::less<>> logged_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
