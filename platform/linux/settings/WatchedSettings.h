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

// Which file of which name it was, so that another one, or a touch, is told from it.
struct FileMark {
  std::uint64_t inode = 0;
  std::int64_t changedAt = 0;  // nanoseconds
  friend bool operator==(const FileMark&, const FileMark&) = default;
};

// A file, beside those in the directory of preferences, on which the values of a domain depend.
struct LinkedSetting {
  std::filesystem::path file;
  std::string domain;
  friend bool operator==(const LinkedSetting&, const LinkedSetting&) = default;
};

// How everything that posts one name looked at some moment.
struct SettingBaseline {
  std::optional<FileMark> file;                 // of that name in the notify directory
  std::map<std::string, Dictionary> domains{};  // values of the domains that the name belongs to
};

// Decides which notifications are to be posted after files have changed.
//
// A name is posted by a file of its name in the notify directory, and by a change of the values of
// a domain that it belongs to: the name begins with the domain's name and a dot, or is equal to it.
// So nobody has to say what belongs together, and a domain that is set up later needs no change
// here.
//
// Holds what it saw last of each file, so that it also finds changes that nobody told it of.
// Belongs to one thread; reads files.
class WatchedSettings {
 public:
  // Does not own these, which must outlive it.
  WatchedSettings(std::filesystem::path notifyDirectory, const PreferenceReader& reader,
                  StatisticsService& statistics);

  // What a name's files are like now. Any thread may call.
  [[nodiscard]] SettingBaseline look(const std::string& name) const;
  // Watches a name from the state that `baseline` tells of; what has changed since is news.
  void add(const std::string& name, SettingBaseline&& baseline);

  // A file in the notify directory was written, touched, created or moved there. That posts its
  // name even when the file is gone again, or looks as it did before.
  void noteNotifyFile(std::string_view file);
  // A file in the directory of preferences has changed.
  void notePreferenceFile(std::string_view file);
  // What the file of that domain leads to has changed.
  void noteDomain(std::string_view domain);
  // Anything may have changed.
  void noteEverything();

  // The symbolic links on the way to the files of all domains, and what they lead to now.
  [[nodiscard]] std::vector<LinkedSetting> linkedSettings() const;

  [[nodiscard]] bool hasNews() const { return !names_.news.empty() || !domains_.news.empty(); }
  // Looks at all that was noted, and gives the names to post, each once.
  [[nodiscard]] std::set<std::string> settle();

 private:
  // What is known of each, and which of them to look at.
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
