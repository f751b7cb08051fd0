#pragma once

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/settings/DirectoryWatch.h"
#include "platform/linux/settings/WatchedSettings.h"
#include "platform/notify.h"
#include "platform/object_log.h"

namespace halvox::platform::linux_ {

// kNotifyInvalidName is for a name that a file cannot have, kNotifyFailed for every other failure.
inline constexpr NotifyStatus kNotifyInvalidName = 1;
inline constexpr NotifyStatus kNotifyFailed = 1'000'000;

// Posts notifications when files change. A notification is posted when a file of its name in the
// notify directory is written, touched, created or moved there, and when the values in a preference
// file of the user "mobile" change (WatchedSettings says which names that posts). Changes shortly
// after each other cause one post, so that one save posts once, however the editor saves. No change
// is lost.
//
// From the first registration on, a thread of its own waits for changes, without a timer. The
// directories may be missing, and may be deleted and created again. Symbolic links on the way to a
// preference file or to the notify directory are followed. A change of the target or of a link
// counts. When the files cannot be watched, for example because of the kernel's limits, the thread
// logs an error once and tries again every five seconds.
//
// Owned by the platform. Any thread may call. Handlers run on the queue of their registration.
class InotifyNotifyService final : public NotifyService {
 public:
  // Does not own the reader, the log and the statistics, which must outlive it.
  InotifyNotifyService(const std::filesystem::path& directory, const PreferenceReader& preferences,
                       LogService& log, StatisticsService& statistics);
  InotifyNotifyService(const InotifyNotifyService&) = delete;
  InotifyNotifyService& operator=(const InotifyNotifyService&) = delete;
  ~InotifyNotifyService() override { stop(); }

  // Returns 0 and a new token, kNotifyInvalidName for a name that a file cannot have, or
  // kNotifyFailed after stop() or when the thread cannot be started. Blocks on the disk.
  NotifyStatus notify_register_dispatch(std::string_view name, NotifyToken& token,
                                        std::shared_ptr<DispatchQueue> queue,
                                        Handler handler) override HALVOX_EXCLUDES(mutex_);
  // Ends the thread and waits for it. Nothing is posted afterwards, and registrations fail.
  // Idempotent.
  void stop() HALVOX_EXCLUDES(mutex_);

 private:
  using Clock = std::chrono::steady_clock;
  struct Registration {
    std::string name;
    NotifyToken token;
    std::shared_ptr<DispatchQueue> queue;
    std::shared_ptr<const Handler> handler;
    SettingBaseline baseline;
  };

  [[nodiscard]] bool ensureRunning() HALVOX_REQUIRES(mutex_);
  // The functions below run on the thread.
  void run();
  [[nodiscard]] bool adoptRegistrations() HALVOX_EXCLUDES(mutex_);
  void arm();
  void followLinks();
  [[nodiscard]] bool isNotifyLink(std::size_t directory, std::string_view file) const;
  void logNotifyDirectory();
  void readChanges();
  void noteNews();
  void deliver();
  [[nodiscard]] std::optional<Clock::time_point> nextWork() const;

  const ObjectLog log_;
  // The directories that are always watched. The list for `watch_` has these first, then the
  // directories of `linked_`, then those of `notifyLinks_`.
  const std::vector<std::filesystem::path> directories_;
  DirectoryWatch watch_;
  std::vector<LinkedSetting> linked_;               // of the preference files, as watched
  std::vector<std::filesystem::path> notifyLinks_;  // of the notify directory, as watched
  bool hasNotifyDirectory_ = false;
  bool notifyDirectoryWasGone_ = false;
  WatchedSettings settings_;
  std::vector<Registration> registrations_;
  std::optional<Clock::time_point> retryAt_;    // when to try again to watch
  std::optional<Clock::time_point> firstNews_;  // the first change since the last post
  Clock::time_point lastNews_;
  Counter& delivered_;

  Mutex mutex_;
  UniqueFd wake_ HALVOX_GUARDED_BY(mutex_);
  std::vector<Registration> waiting_ HALVOX_GUARDED_BY(mutex_);
  NotifyToken lastToken_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool isStopping_ HALVOX_GUARDED_BY(mutex_) = false;
  std::thread thread_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
