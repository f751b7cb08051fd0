#include "platform/linux/tracing/lttng/SessionDaemon.h"

#include <system_error>
#include <thread>
#include <utility>

#include <lttng/lttng.h>

namespace halvox::platform::linux_ {
namespace {

// The polling interval. The library has no call that waits for the daemon.
constexpr std::chrono::milliseconds kLookEvery{10};

}  // namespace

bool SessionDaemon::isNoted() const {
  std::error_code ignored;
  return std::filesystem::exists(noteFile_, ignored);
}

void SessionDaemon::adopt(const std::string& ownSessions) {
  // Wait for the keeper of the last run, which may be ending its daemon now. If that daemon were
  // adopted, it would end a moment later.
  TracerKeeper::awaitEarlier(noteFile_, keeperEndsWithin());
  ownSessions_ = ownSessions;
  auto noted = DaemonProcess::read(noteFile_);
  // The start time is compared, too, because after a restart of the machine, the ID may be that of
  // another process.
  if (!noted || !noted->isAlive()) return forget();
  process_ = std::move(noted);
  // If there is no keeper now, leave() tries again to start one.
  static_cast<void>(keeper_.keep({noteFile_, ownSessions_}, *process_));
}

Result<void> SessionDaemon::start(const std::string& ownSessions) {
  // End our daemon first: if it runs but does not answer, it prevents a new one from starting.
  end();
  ownSessions_ = ownSessions;
  auto started = keeper_.start({noteFile_, ownSessions_});
  if (!started) return std::move(started).error();
  process_ = *std::move(started);
  const auto deadline = std::chrono::steady_clock::now() + limits_.answersWithin;
  while (::lttng_session_daemon_alive() != 1) {
    const bool isGone = !process_->isAlive();
    if (isGone || std::chrono::steady_clock::now() > deadline) {
      end();
      return Failure<>{isGone ? "lttng-sessiond ended at once" : "lttng-sessiond does not answer"};
    }
    std::this_thread::sleep_for(kLookEvery);
  }
  return {};
}

void SessionDaemon::end() {
  if (!process_.has_value()) return;
  // End the daemon first. Otherwise, the keeper would ask the daemon for its sessions, and would
  // wait for a daemon that hangs.
  process_->end(limits_.endsWithin);
  keeper_.release();
  forget();
}

void SessionDaemon::leave() {
  if (!process_.has_value()) return;
  // If the keeper was killed, another one does its work.
  if (!keeper_.release() && process_->isAlive() &&
      keeper_.keep({noteFile_, ownSessions_}, *process_)) {
    keeper_.release();
  }
  process_.reset();
}

void SessionDaemon::forget() {
  process_.reset();
  std::error_code ignored;
  std::filesystem::remove(noteFile_, ignored);
}

}  // namespace halvox::platform::linux_
