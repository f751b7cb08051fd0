#include "platform/linux/settings/WatchedSettings.h"

#include <utility>

#include <sys/stat.h>

#include "platform/linux/settings/LinkedFiles.h"
#include "platform/linux/settings/PreferenceFile.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kPiece = "notifications";
constexpr std::string_view kPreferenceEnding = ".toml";
constexpr std::int64_t kNanoseconds = 1'000'000'000;

// Returns the domains that a name belongs to: "a", "a.b" and "a.b.c" for "a.b.c".
std::vector<std::string> domainsOf(const std::string& name) {
  std::vector<std::string> domains;
  for (std::size_t dot = name.find('.'); dot != std::string::npos; dot = name.find('.', dot + 1)) {
    if (dot > 0) domains.push_back(name.substr(0, dot));
  }
  domains.push_back(name);
  return domains;
}

bool belongsTo(std::string_view name, std::string_view domain) {
  return name.starts_with(domain) && (name.size() == domain.size() || name[domain.size()] == '.');
}

}  // namespace

WatchedSettings::WatchedSettings(std::filesystem::path notifyDirectory,
                                 const PreferenceReader& reader, StatisticsService& statistics)
    : notifyDirectory_(std::move(notifyDirectory)),
      reader_(reader),
      counters_{statistics.counter(kPiece, "noticed"), statistics.counter(kPiece, "posted"),
                statistics.counter(kPiece, "suppressed: nothing new"),
                statistics.counter(kPiece, "suppressed: preferences not readable"),
                statistics.counter(kPiece, "merged with another")} {}

std::optional<FileMark> WatchedSettings::mark(const std::string& name) const {
  struct stat status {};
  // Use lstat, because replacing a link is also a change. Use the time of the last status change,
  // because `touch -d` can set the other times.
  if (::lstat((notifyDirectory_ / name).c_str(), &status) != 0) return std::nullopt;
  return FileMark{status.st_ino, status.st_ctim.tv_sec * kNanoseconds + status.st_ctim.tv_nsec};
}

SettingBaseline WatchedSettings::look(const std::string& name) const {
  SettingBaseline baseline{mark(name)};
  for (const std::string& domain : domainsOf(name)) {
    // A file that cannot be read counts as empty. Fixing it is then a change.
    baseline.domains[domain] = reader_.read(kPreferenceUser, domain).value_or(Dictionary());
  }
  return baseline;
}

void WatchedSettings::add(const std::string& name, SettingBaseline&& baseline) {
  // Note each new entry as changed. It is then compared once, because it may have changed since the
  // baseline was taken.
  if (names_.known.emplace(name, NotifyFile{baseline.file}).second) names_.news.insert(name);
  for (auto& [domain, values] : baseline.domains) {
    if (domains_.known.emplace(domain, std::move(values)).second) domains_.news.insert(domain);
  }
}

void WatchedSettings::noteNotifyFile(std::string_view file) {
  const auto known = names_.known.find(file);
  if (known == names_.known.end()) return;
  // The event alone is a reason to post, because the file may be deleted again before its state is
  // read.
  known->second.wasTouched = true;
  names_.news.insert(known->first);
}

void WatchedSettings::notePreferenceFile(std::string_view file) {
  if (!file.ends_with(kPreferenceEnding)) return;
  noteDomain(file.substr(0, file.size() - kPreferenceEnding.size()));
}

void WatchedSettings::noteDomain(std::string_view domain) {
  const auto known = domains_.known.find(domain);
  if (known != domains_.known.end()) domains_.news.insert(known->first);
}

std::vector<LinkedSetting> WatchedSettings::linkedSettings() const {
  std::vector<LinkedSetting> linked;
  for (const auto& [domain, known] : domains_.known) {
    const auto path = preferencePath(reader_.directory(), kPreferenceUser, domain);
    if (!path.has_value()) continue;
    for (auto& file : linkedFiles(*path)) linked.push_back({std::move(file), domain});
  }
  return linked;
}

void WatchedSettings::noteEverything() {
  for (const auto& [name, known] : names_.known) names_.news.insert(name);
  for (const auto& [domain, known] : domains_.known) domains_.news.insert(domain);
}

std::set<std::string> WatchedSettings::settle() {
  std::set<std::string> posts;
  for (const std::string& name : std::exchange(names_.news, {})) {
    counters_.noticed.add();
    if (settleName(name)) post(name, posts);
  }
  for (const std::string& domain : std::exchange(domains_.news, {})) {
    if (!settleDomain(domain)) continue;
    for (const auto& [name, known] : names_.known) {
      if (!belongsTo(name, domain)) continue;
      counters_.noticed.add();
      post(name, posts);
    }
  }
  return posts;
}

bool WatchedSettings::settleName(const std::string& name) {
  const NotifyFile before = std::exchange(names_.known[name], NotifyFile{mark(name)});
  const auto& now = names_.known[name].mark;
  // A file that has disappeared does not post its name, unless it was touched before.
  const bool isNews = before.wasTouched || (now.has_value() && now != before.mark);
  if (!isNews) counters_.unchanged.add();
  return isNews;
}

// A file that cannot be read does not count as changed. Listeners keep the previous values, and are
// notified when the file is fixed and has other values.
bool WatchedSettings::settleDomain(const std::string& domain) {
  auto now = reader_.read(kPreferenceUser, domain);
  if (!now.has_value()) {
    counters_.noticed.add();
    counters_.unreadable.add();
    return false;
  }
  Dictionary& known = domains_.known[domain];
  // The file was saved, but the values of this domain are the same.
  if (*now == known) {
    counters_.noticed.add();
    counters_.unchanged.add();
    return false;
  }
  known = *std::move(now);
  return true;
}

void WatchedSettings::post(const std::string& name, std::set<std::string>& posts) {
  (posts.insert(name).second ? counters_.posted : counters_.merged).add();
}

}  // namespace halvox::platform::linux_
