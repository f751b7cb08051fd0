#include "platform/linux/store/reading/EventFollower.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <string_view>

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/timerfd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

// inotify reports the write to the write-ahead log, but readers see the commit only a moment later,
// which inotify does not report. After each report the follower therefore looks again after these
// times, in milliseconds. The last two are for a service that was suspended between the write and
// the commit by a busy machine.
constexpr std::array kLooksAgain{25, 25, 25, 250, 1000};
constexpr long kNanosecondsPerMillisecond = 1'000'000;

constexpr std::uint32_t kWatched =
    IN_MODIFY | IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;

Failure<StoreError> systemFailure(const std::filesystem::path& directory) {
  const auto kind =
      errno == ENOENT || errno == ENOTDIR ? StoreError::kMissing : StoreError::kCannotOpen;
  return {kind, directory.native() + ": cannot watch the directory: " + errnoText(errno)};
}

// Returns false for the -shm file, because readers write to it, too, and the follower would wake
// itself.
bool isStoreFile(std::string_view name) {
  return name.starts_with(kStoreFileName) && !name.ends_with("-shm");
}

}  // namespace

Result<void, StoreError> EventFollower::open(const std::filesystem::path& directory,
                                             const RecordFilter& filter) {
  directory_ = directory;
  filter_ = filter;
  started_ = false;
  // Callers wait on one descriptor. epoll combines the watch and the timer in it.
  poller_.reset(::epoll_create1(EPOLL_CLOEXEC));
  timer_.reset(::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC));
  watch_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!poller_ || !timer_ || !watch_) return systemFailure(directory);
  // Watch before the first read. A record that is stored after the read but before the watch would
  // go unnoticed.
  if (::inotify_add_watch(watch_.get(), directory.c_str(), kWatched) < 0) {
    return systemFailure(directory);
  }
  for (const int source : {watch_.get(), timer_.get()}) {
    epoll_event interest{};
    interest.events = EPOLLIN;
    if (::epoll_ctl(poller_.get(), EPOLL_CTL_ADD, source, &interest) != 0) {
      return systemFailure(directory);
    }
  }
  return reader_.open(directory);
}

Result<void, StoreError> EventFollower::deliver(const StoreReader::EventCallback& callback) {
  return deliverBy([&] { return reader_.forEachEvent(filter_, callback); });
}

Result<void, StoreError> EventFollower::deliver(const RecordTable& table,
                                                const StoreReader::RecordCallback& callback) {
  return deliverBy([&] { return reader_.forEachRecord(table, filter_, callback); });
}

template <typename Read>
Result<void, StoreError> EventFollower::deliverBy(Read read) {
  hasGap_ = false;
  const Change change = readChanges();
  if (change == Change::kDirectoryGone) {
    return Failure<StoreError>{StoreError::kMissing,
                               directory_.native() + ": the directory was removed"};
  }
  const bool timerRan = readTimer();
  if (change == Change::kStoreWritten) looksLeft_ = kLooksAgain.size();
  if (change == Change::kNone && !timerRan && started_) return {};
  if (looksLeft_ > 0) startTimer();
  if (reader_.isReplaced()) {
    // Deliver what the service stored in the old database before it was replaced. That database may
    // be damaged: it was perhaps replaced for this reason.
    if (started_ && read()) filter_.after = std::max(filter_.after, reader_.lastRead());
    const auto isOpen = reopen();
    if (!isOpen) return isOpen.error();
    if (!*isOpen) return {};
  }
  started_ = true;
  Result<void, StoreError> done = read();
  // Continue after the last record that was read, not after the last one that was delivered. If no
  // record passes the filter, as with `newest` 0, all stored records would otherwise count as new
  // the next time.
  if (done) filter_.after = std::max(filter_.after, reader_.lastRead());
  hasGap_ = done && reader_.hasGap();
  // `newest` limits only the first delivery, because everything that is stored later is new.
  filter_.newest.reset();
  return done;
}

// Opens the database that replaced the old one. Its record IDs start from 1. Returns false while
// there is no such database. Opening a database that is still being created can fail in any way.
// Only the error of the last attempt is therefore returned.
Result<bool, StoreError> EventFollower::reopen() {
  auto opened = reader_.open(directory_);
  if (opened) {
    filter_.after = 0;
  } else if (opened.error().code != StoreError::kMissing && looksLeft_ == 0) {
    return std::move(opened).error();
  }
  return opened.has_value();
}

EventFollower::Change EventFollower::readChanges() {
  Change change = Change::kNone;
  alignas(inotify_event) std::array<char, 4096> buffer;
  while (true) {
    const ssize_t length = ::read(watch_.get(), buffer.data(), buffer.size());
    if (length <= 0) return change;
    for (std::size_t at = 0; at < static_cast<std::size_t>(length);) {
      const auto* event = reinterpret_cast<const inotify_event*>(&buffer[at]);
      at += sizeof *event + event->len;
      if ((event->mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED)) != 0) {
        return Change::kDirectoryGone;
      }
      // After an overflow the kernel has dropped events, and some of them may have concerned the
      // store.
      const bool overflow = (event->mask & IN_Q_OVERFLOW) != 0;
      if (overflow || (event->len > 0 && isStoreFile(event->name))) change = Change::kStoreWritten;
    }
  }
}

bool EventFollower::readTimer() {
  std::uint64_t expirations = 0;
  if (::read(timer_.get(), &expirations, sizeof expirations) != sizeof expirations) return false;
  if (looksLeft_ > 0) --looksLeft_;
  return true;
}

void EventFollower::startTimer() {
  itimerspec delay{};
  const int milliseconds = kLooksAgain[kLooksAgain.size() - looksLeft_];
  delay.it_value.tv_sec = milliseconds / 1000;
  delay.it_value.tv_nsec = milliseconds % 1000 * kNanosecondsPerMillisecond;
  ::timerfd_settime(timer_.get(), 0, &delay, nullptr);
}

}  // namespace halvox::platform::linux_
