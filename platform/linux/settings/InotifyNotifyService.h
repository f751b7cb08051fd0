#pragma once

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/linux/Mutex.h"
#include "platform/linux/UniqueHandle.h"
#include "platform/linux/settings/DirectoryWatch.h"
#include "platform/linux/settings/WatchedSettings.h"
#include "platform/notify.h"

namespace halvox::platform::linux_ {

inline constexpr NotifyStatus kNotifyInvalidName = 1;
inline constexpr NotifyStatus kNotifyFailed = 1'000'000;

// Notifications that files post: a file of the name in the notify directory that is written,
// touched, created or moved there, and a preference file of the user "mobile" whose values change
// (see WatchedSettings for which names it posts). Several changes that come close together are one
// post, a moment after the last of them, so that one save posts once however it is done; none is
// lost.
//
// A thread of its own waits for the files, from the first registration on; it sleeps while nothing
// happens. Directories may be missing, and may be deleted and made again. Symbolic links on the way
// to a preference file or to the directory of names are followed: a change behind them, or of one
// of them, counts. When watching
// fails (the kernel's limits) it says so once and tries again.
class InotifyNotifyService final : public NotifyService {
 public:
  // Does not own the reader and the statistics, which must outlive it.
  InotifyNotifyService(const std::filesystem::path& directory, const PreferenceReader& preferences,
                       StatisticsService& statistics);
  InotifyNotifyService(const InotifyNotifyService&) = delete;
  InotifyNotifyService& operator=(const InotifyNotifyService&) = delete;
  ~InotifyNotifyService() override { stop(); }

  // Refuses names that cannot be those of files (kNotifyInvalidName). Reads files.
  NotifyStatus notify_register_dispatch(std::string_view name, NotifyToken& token,
                                        std::shared_ptr<DispatchQueue> queue,
                                        Handler handler) override HALVOX_EXCLUDES(mutex_);
  // Ends the thread: nothing is posted any more. Registrations are in vain from here on.
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
  // The rest runs on the thread.
  void run();
  [[nodiscard]] bool adoptRegistrations() HALVOX_EXCLUDES(mutex_);
  void arm();
  void followLinks();
  [[nodiscard]] bool isNotifyLink(std::size_t directory, std::string_view file) const;
  void tellOfNotifyDirectory();
  void readChanges();
  void noteNews();
  void deliver();
  [[nodiscard]] std::optional<Clock::time_point> nextWork() const;

  // The directories that are always watched, in order; those of `linked_` and of `notifyLinks_`
  // come behind them.
  const std::vector<std::filesystem::path> directories_;
  DirectoryWatch watch_;
  std::vector<LinkedSetting> linked_;               // as watched
  std::vector<std::filesystem::path> notifyLinks_;  // the same for the directory of names
  bool hasNotifyDirectory_ = false;
  bool notifyDirectoryWasGone_ = false;
  WatchedSettings settings_;
  std::vector<Registration> registrations_;
  std::optional<Clock::time_point> retryAt_;    // when watching is tried again
  std::optional<Clock::time_point> firstNews_;  // since the last post
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
