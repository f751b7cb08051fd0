#include "platform/linux/settings/InotifyNotifyService.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <system_error>
#include <utility>

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/settings/LinkedFiles.h"
#include "platform/linux/settings/PreferenceFile.h"
#include "platform/linux/settings/SettingNames.h"
#include "platform/linux/settings/SettingsLog.h"

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;

// A change is posted when no other has followed for kQuietTime. It is posted at the latest
// kLongestDelay after the first change, because steady changes must not delay a post for ever.
constexpr auto kQuietTime = 50ms;
constexpr auto kLongestDelay = 300ms;
// The interval between attempts to watch. Used only while watching fails, so that the thread does
// not wake up otherwise.
constexpr auto kRetryTime = 5s;

// The directories that are always watched, in order.
constexpr std::size_t kNotifyDirectory = 0;
constexpr std::size_t kPreferenceDirectory = 1;
constexpr std::size_t kFirstLinked = 2;

int pollTimeout(std::optional<std::chrono::steady_clock::time_point> until) {
  if (!until.has_value()) return -1;  // sleep until something happens
  const auto left =
      std::chrono::ceil<std::chrono::milliseconds>(*until - std::chrono::steady_clock::now());
  return static_cast<int>(std::max<std::int64_t>(left.count(), 0));
}

void drain(int descriptor) {
  std::uint64_t count = 0;
  static_cast<void>(!::read(descriptor, &count, sizeof count));
}

}  // namespace

InotifyNotifyService::InotifyNotifyService(const std::filesystem::path& directory,
                                           const PreferenceReader& preferences, LogService& log,
                                           StatisticsService& statistics)
    : log_(settingsLog(log, "InotifyNotifyService")),
      directories_{directory, preferences.directory() / kPreferenceUser},
      settings_(directory, preferences, statistics),
      delivered_(statistics.counter("notifications", "handlers called")) {}

NotifyStatus InotifyNotifyService::notify_register_dispatch(std::string_view name,
                                                            NotifyToken& token,
                                                            std::shared_ptr<DispatchQueue> queue,
                                                            Handler handler) {
  if (!isUsableName(name)) {
    log_.error("cannot register for the notification ", shownName(name),
               ": expected a name that a file can have; it will never be posted");
    return kNotifyInvalidName;
  }
  // Read the state before the thread adopts the registration. By comparing with it, the thread
  // finds every change from here on, although it does not watch yet.
  SettingBaseline baseline = settings_.look(std::string(name));
  const MutexLock held(mutex_);
  if (isStopping_ || !ensureRunning()) return kNotifyFailed;
  token = ++lastToken_;
  waiting_.push_back({std::string(name), token, std::move(queue),
                      std::make_shared<const Handler>(std::move(handler)), std::move(baseline)});
  static_cast<void>(::eventfd_write(wake_.get(), 1));
  return 0;
}

bool InotifyNotifyService::ensureRunning() {
  // The first registration starts the thread, because a service without registrations needs none.
  if (thread_.joinable()) return true;
  wake_.reset(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!wake_) return false;
  try {
    thread_ = std::thread([this] { run(); });
  } catch (const std::system_error&) {
    return false;
  }
  return true;
}

void InotifyNotifyService::stop() {
  std::thread ending;
  {
    const MutexLock held(mutex_);
    isStopping_ = true;
    // Join without the lock, which the thread takes to adopt registrations.
    ending.swap(thread_);
    if (wake_) static_cast<void>(::eventfd_write(wake_.get(), 1));
  }
  if (ending.joinable()) ending.join();
}

void InotifyNotifyService::run() {
  setUpThread("halvox.notify");
  int wake = -1;
  {
    const MutexLock held(mutex_);
    wake = wake_.get();
  }
  arm();
  while (adoptRegistrations()) {
    std::array<pollfd, 2> polled{{{wake, POLLIN, 0}, {watch_.descriptor(), POLLIN, 0}}};
    // Sleeps without a time limit while nothing has changed and watching works.
    if (::poll(polled.data(), polled.size(), pollTimeout(nextWork())) < 0) continue;
    if (polled[0].revents != 0) drain(wake);
    if (polled[1].revents != 0) readChanges();
    if (retryAt_.has_value() && Clock::now() >= *retryAt_) arm();
    followLinks();
    deliver();
  }
}

// Returns false when the thread must end.
bool InotifyNotifyService::adoptRegistrations() {
  std::vector<Registration> adopted;
  {
    const MutexLock held(mutex_);
    if (isStopping_) return false;
    adopted.swap(waiting_);
  }
  for (Registration& one : adopted) {
    settings_.add(one.name, std::exchange(one.baseline, {}));
    registrations_.push_back(std::move(one));
    noteNews();
  }
  return true;
}

void InotifyNotifyService::arm() {
  const bool wasFailing = retryAt_.has_value();
  // Find the links first, because their targets decide which directories are watched.
  linked_ = settings_.linkedSettings();
  notifyLinks_ = linkedFiles(directories_[kNotifyDirectory]);
  std::vector<std::filesystem::path> directories = directories_;
  for (const LinkedSetting& one : linked_) directories.push_back(one.file.parent_path());
  for (const std::filesystem::path& link : notifyLinks_) directories.push_back(link.parent_path());
  const std::error_code error = watch_.arm(std::move(directories));
  retryAt_.reset();
  if (error) {
    retryAt_ = Clock::now() + kRetryTime;
    if (!wasFailing) {
      log_.error("cannot watch the directories of the settings: ", error.message(),
                 "; changes go unnoticed until that succeeds; trying again every ",
                 kRetryTime.count(), " s");
    }
  } else if (wasFailing) {
    log_.notice("watching the directories of the settings again");
  }
  logNotifyDirectory();
  // Compare everything once, to find the changes that happened while nothing was watched and those
  // whose events were lost.
  settings_.noteEverything();
  noteNews();
}

// Watches other directories if links now lead elsewhere. Every change may have been one of a link.
void InotifyNotifyService::followLinks() {
  if (!settings_.hasNews()) return;
  if (settings_.linkedSettings() != linked_ ||
      linkedFiles(directories_[kNotifyDirectory]) != notifyLinks_) {
    arm();
  }
}

bool InotifyNotifyService::isNotifyLink(std::size_t directory, std::string_view file) const {
  const std::size_t first = kFirstLinked + linked_.size();
  return directory >= first && notifyLinks_[directory - first].filename() == file;
}

// Logs when the notify directory is deleted, which explains why notifications stop, and when it
// exists again. A directory that never existed is not logged.
void InotifyNotifyService::logNotifyDirectory() {
  const bool isThere = watch_.isThere(kNotifyDirectory);
  if (isThere == std::exchange(hasNotifyDirectory_, isThere)) return;
  if (!isThere) {
    log_.notice("the notify directory ", watch_.path(kNotifyDirectory).native(),
                " was deleted; waiting until it exists again");
    notifyDirectoryWasGone_ = true;
  } else if (notifyDirectoryWasGone_) {
    log_.notice("the notify directory ", watch_.path(kNotifyDirectory).native(),
                " exists again; watching it");
  }
}

void InotifyNotifyService::readChanges() {
  bool leadsElsewhere = false;
  const auto state =
      watch_.read([&](std::size_t directory, std::string_view file, DirectoryWatch::Change change) {
        if (directory >= kFirstLinked + linked_.size()) {
          leadsElsewhere = leadsElsewhere || isNotifyLink(directory, file);
        } else if (directory >= kFirstLinked) {
          const LinkedSetting& linked = linked_[directory - kFirstLinked];
          if (linked.file.filename() == file) settings_.noteDomain(linked.domain);
        } else if (directory == kPreferenceDirectory) {
          settings_.notePreferenceFile(file);
        } else if (change == DirectoryWatch::Change::kFileChanged) {
          settings_.noteNotifyFile(file);
        }
        noteNews();
      });
  if (state == DirectoryWatch::State::kMustBeArmedAgain || leadsElsewhere) arm();
}

void InotifyNotifyService::noteNews() {
  if (!settings_.hasNews()) return;
  lastNews_ = Clock::now();
  if (!firstNews_.has_value()) firstNews_ = lastNews_;
}

std::optional<InotifyNotifyService::Clock::time_point> InotifyNotifyService::nextWork() const {
  if (!firstNews_.has_value()) return retryAt_;
  const auto due = std::min(lastNews_ + kQuietTime, *firstNews_ + kLongestDelay);
  return retryAt_.has_value() ? std::min(due, *retryAt_) : due;
}

void InotifyNotifyService::deliver() {
  if (!firstNews_.has_value()) return;
  if (Clock::now() < std::min(lastNews_ + kQuietTime, *firstNews_ + kLongestDelay)) return;
  firstNews_.reset();
  // A set, because one save can change several domains of one name, and must post the name only
  // once.
  const std::set<std::string> posted = settings_.settle();
  for (const Registration& one : registrations_) {
    if (!posted.contains(one.name)) continue;
    log_.debug("posting ", one.name);
    delivered_.add();
    one.queue->async(JobWeight::kMayBlock,
                     [handler = one.handler, token = one.token] { (*handler)(token); });
  }
}

}  // namespace halvox::platform::linux_
