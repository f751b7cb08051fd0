#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/settings/PreferenceReader.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Identifies the state of a file, to notice that it was touched or replaced by another.
struct FileMark {
  std::uint64_t inode = 0;
  std::int64_t changedAt = 0;  // nanoseconds
  friend bool operator==(const FileMark&, const FileMark&) = default;
};

// A file outside the preference directory on which the values of a domain depend: a symbolic link
// or its target.
struct LinkedSetting {
  std::filesystem::path file;
  std::string domain;
  friend bool operator==(const LinkedSetting&, const LinkedSetting&) = default;
};

// The state of all files that can post one name, at one moment.
struct SettingBaseline {
  std::optional<FileMark> file;                 // the file of that name in the notify directory
  std::map<std::string, Dictionary> domains{};  // the values of the name's domains
};

// Decides which notifications to post after files have changed.
//
// A name is posted when the file of that name in the notify directory changes, and when the values
// of one of its domains change. The name "a.b.c" belongs to the domains "a.b.c", "a.b" and "a". No
// list of names and domains is needed, and a new domain works at once.
//
// Remembers the last state of each file and compares with it, so that it also finds changes that
// were not announced. A preference file that cannot be read counts as unchanged until it can be
// read.
// Owned by InotifyNotifyService and used on its thread, except look(). Blocks on the disk.
class WatchedSettings {
 public:
  // Does not own the reader and the statistics, which must outlive it.
  WatchedSettings(std::filesystem::path notifyDirectory, const PreferenceReader& reader,
                  StatisticsService& statistics);

  // Returns the current state of the files of a name. Any thread may call.
  [[nodiscard]] SettingBaseline look(const std::string& name) const;
  // Starts to watch a name. Changes since `baseline` was taken count.
  void add(const std::string& name, SettingBaseline&& baseline);

  // Notes that a file in the notify directory was written, touched, created or moved there. This
  // posts its name even if the file was deleted again or looks the same as before.
  void noteNotifyFile(std::string_view file);
  // Notes that a file in the preference directory has changed.
  void notePreferenceFile(std::string_view file);
  // Notes that the target of a domain's file has changed.
  void noteDomain(std::string_view domain);
  // Notes that anything may have changed.
  void noteEverything();

  // Returns the symbolic links on the way to the files of all domains, and their targets.
  [[nodiscard]] std::vector<LinkedSetting> linkedSettings() const;

  // Returns true when something was noted since the last settle().
  [[nodiscard]] bool hasNews() const { return !names_.news.empty() || !domains_.news.empty(); }
  // Examines everything that was noted and returns the names to post, each once.
  [[nodiscard]] std::set<std::string> settle();

 private:
  // The known state of each name or domain, and those that must be examined.
  template <typename Known>
  struct Watched {
    std::map<std::string, Known, std::less<>> known;
    std::set<std::string> news;
  };
  struct Counters {
    Counter& noticed;
    Counter& posted;
    Counter& unchanged;
    Counter& unreadable;
    Counter& merged;
  };

  struct NotifyFile {
    std::optional<FileMark> mark;
    bool wasTouched = false;
  };

  [[nodiscard]] std::optional<FileMark> mark(const std::string& name) const;
  bool settleName(const std::string& name);
  bool settleDomain(const std::string& domain);
  void post(const std::string& name, std::set<std::string>& posts);

  const std::filesystem::path notifyDirectory_;
  const PreferenceReader& reader_;
  const Counters counters_;  // noticed = the sum of all others
  Watched<NotifyFile> names_;
  Watched<Dictionary> domains_;
};

}  // namespace halvox::platform::linux_
