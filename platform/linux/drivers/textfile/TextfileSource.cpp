#include "platform/linux/drivers/textfile/TextfileSource.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <functional>
#include <unordered_set>
#include <utility>

#include <dirent.h>
#include <fcntl.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

// Twenty milliseconds, because file times advance in steps of up to 10 ms. A file that is read
// within a step may change again without getting another time.
constexpr std::int64_t kTimeStep = 20'000'000;

constexpr const char* kSkipped = "; skipping the file";

using Directory = UniqueHandle<DIR*, ::closedir>;

std::int64_t nanoseconds(const timespec& time) {
  return std::int64_t{time.tv_sec} * 1'000'000'000 + time.tv_nsec;
}

std::int64_t now() {
  return std::chrono::duration_cast<std::chrono::nanoseconds>(
             std::chrono::system_clock::now().time_since_epoch())
      .count();
}

std::string reasonOf(const FileContent& file) {
  switch (file.outcome) {
    case FileContent::Outcome::kTooLarge:
      return "the file is larger than " + std::to_string(OpenMetricsText::kLargestText) + " bytes";
    case FileContent::Outcome::kNotRegular:
      return "expected a regular file";
    case FileContent::Outcome::kRead:
    case FileContent::Outcome::kMissing:
    case FileContent::Outcome::kFailed:
      break;
  }
  return errnoText(file.error);
}

}  // namespace

std::shared_ptr<const Reading> TextfileSource::read() {
  ++round_;
  // A limit for all files together. With fifty large files, each within its own limit, the service
  // used half a gigabyte.
  std::size_t room = kMostBytes;
  // Do this before listing the files. A file that is deleted later is noticed at the next reading.
  forgetRemoved();
  const UniqueFd directory = openDirectory(directory_.c_str());
  for (const std::string& file : directory ? list(directory.get()) : std::vector<std::string>()) {
    Entry& entry = entries_[file];
    entry.round = round_;
    readEntry(directory.get(), file, room, entry);
  }
  isChanged_ |=
      std::erase_if(entries_, [this](const auto& item) { return item.second.round != round_; }) > 0;
  if (std::exchange(isChanged_, false)) chooseChannels();
  for (const auto& [file, entry] : entries_) {
    if (!entry.isGood) continue;
    for (std::size_t index = 0; index < entry.channels.size(); ++index) {
      if (entry.isShown[index]) readings_.add(entry.channels[index], entry.values[index]);
    }
  }
  return readings_.finish();
}

void TextfileSource::forgetRemoved() {
  const auto [areAll, names] = removedFiles_.take();
  std::size_t forgotten = 0;
  for (const std::string& name : names) forgotten += entries_.erase(name);
  if (areAll) forgotten += std::exchange(entries_, {}).size();
  isChanged_ |= forgotten > 0;
}

std::vector<std::string> TextfileSource::list(int directory) {
  std::vector<std::string> files;
  UniqueFd own(::fcntl(directory, F_DUPFD_CLOEXEC, 0));
  const Directory stream(::fdopendir(own.get()));
  if (!stream) return files;
  static_cast<void>(own.release());  // the stream closes it
  while (const dirent* found = ::readdir(stream.get())) {
    const std::string_view name = found->d_name;
    if (name.ends_with(".prom") && !name.starts_with('.')) files.emplace_back(name);
  }
  // Sort the files, because the first one that defines a channel provides it. The order must not
  // change between two readings.
  std::ranges::sort(files);
  const bool areTooMany = files.size() > kMostFiles;
  if (areTooMany && !std::exchange(isExcessLogged_, true)) {
    log_.error("the directory ", directory_.string(), " has more than ", kMostFiles,
               " files; skipping those after the first ", kMostFiles);
  }
  isExcessLogged_ = areTooMany;
  if (areTooMany) files.resize(kMostFiles);
  return files;
}

void TextfileSource::readEntry(int directory, const std::string& file, std::size_t& room,
                               Entry& entry) {
  struct stat status {};
  State state;
  if (::fstatat(directory, file.c_str(), &status, 0) != 0) {
    state.error = errno;
  } else {
    // A file that is larger than one file may be is skipped anyway, and does not count for the
    // total size.
    const std::size_t size =
        S_ISREG(status.st_mode) && status.st_size <= off_t{OpenMetricsText::kLargestText}
            ? static_cast<std::size_t>(status.st_size)
            : 0;
    const bool hasRoom = size <= room;
    if (hasRoom) room -= size;
    state = {0, status.st_dev, status.st_ino, status.st_size, nanoseconds(status.st_mtim), hasRoom};
  }
  const bool isSame = state == entry.state;
  if (isSame && entry.isSettled) return;
  if (!isSame) entry.complaint.clear();
  entry.state = state;
  // The file is settled when its last change is older than kTimeStep. Before that, read the file
  // each time, because its time may not show another change.
  entry.isSettled = state.error != 0 || now() - state.changedAt > kTimeStep;
  if (!state.hasRoom) {
    isChanged_ |= std::exchange(entry.isGood, false);
    entry.hash.reset();
    entry.channels = {};
    entry.values = {};
    return complain(file,
                    ": this file and those before it are larger than " +
                        std::to_string(kMostBytes) + " bytes together" + kSkipped,
                    entry);
  }

  const FileContent content = readWholeFile(
      {.path = file.c_str(), .most = OpenMetricsText::kLargestText, .directory = directory});
  const std::size_t hash = std::hash<std::string>()(content.bytes);
  const bool isRead = content.isRead();
  // Most files that are read again have not changed. Comparing a hash saves parsing them.
  if (isSame && isRead && entry.hash == hash) return;
  entry.hash = isRead ? std::optional(hash) : std::nullopt;
  entry.isGood = false;
  isChanged_ = true;
  if (content.isMissing()) return;  // deleted since it was listed
  if (!isRead) {
    return complain(file, ": " + reasonOf(content) + kSkipped, entry);
  }
  auto parsed = MetricChannels::from(content.bytes);
  if (const auto* error = std::get_if<MetricError>(&parsed)) {
    return complain(file, ":" + std::to_string(error->line) + ": " + error->what + kSkipped, entry);
  }
  take(std::move(std::get<std::vector<MetricChannel>>(parsed)), entry);
}

void TextfileSource::take(std::vector<MetricChannel>&& channels, Entry& entry) {
  std::map<std::string, Channel> known;
  // Channels that are still in the file keep their objects, because differences identify channels
  // by address.
  for (const Channel& channel : entry.channels) known.emplace(channel->fullName(), channel);
  entry.channels.clear();
  entry.values.clear();
  for (auto& [description, values, line] : channels) {
    const auto found = known.find(description.fullName());
    entry.channels.push_back(
        found != known.end() && *found->second == description
            ? found->second
            : std::make_shared<const ChannelDescription>(std::move(description)));
    entry.values.push_back(std::move(values));
  }
  entry.isGood = true;
}

void TextfileSource::complain(const std::string& file, const std::string& what, Entry& entry) {
  if (entry.complaint == what) return;
  entry.complaint = what;
  log_.error("driver counters of ", (directory_ / file).string(), what);
}

void TextfileSource::chooseChannels() {
  std::unordered_set<std::string> seen;
  for (auto& [file, entry] : entries_) {
    if (!entry.isGood) continue;
    entry.isShown.assign(entry.channels.size(), true);
    for (std::size_t index = 0; index < entry.channels.size(); ++index) {
      if (seen.insert(entry.channels[index]->fullName()).second) continue;
      entry.isShown[index] = false;
      // Log one line for each file, even if it shares several channels with others.
      if (entry.complaint.empty()) {
        complain(file,
                 ": an earlier file also has the channel " + *entry.channels[index]->channelName +
                     "; ignoring it in this file",
                 entry);
      }
    }
  }
}

}  // namespace halvox::platform::linux_
