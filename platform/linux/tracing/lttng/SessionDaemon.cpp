#include "platform/linux/tracing/lttng/SessionDaemon.h"

#include <system_error>
#include <thread>
#include <utility>

#include <lttng/lttng.h>

namespace halvox::platform::linux_ {
namespace {

constexpr std::chrono::milliseconds kLookEvery{10};  // at a daemon that tells nobody

}  // namespace

bool SessionDaemon::isNoted() const {
  std::error_code ignored;
  return std::filesystem::exists(noteFile_, ignored);
}

void SessionDaemon::adopt(const std::string& ownSessions) {
  TracerKeeper::awaitEarlier(noteFile_, keeperEndsWithin());
  ownSessions_ = ownSessions;
  auto noted = DaemonProcess::read(noteFile_);
  if (!noted || !noted->isAlive()) return forget();
  process_ = std::move(noted);
  // Should there be no keeper now, another one is tried at the end.
  static_cast<void>(keeper_.keep({noteFile_, ownSessions_}, *process_));
}

std::optional<std::string> SessionDaemon::start(const std::string& ownSessions) {
  end();
  ownSessions_ = ownSessions;
  DaemonProcess started;
  auto failure = keeper_.start({noteFile_, ownSessions_}, started);
  if (failure) return failure;
  process_ = std::move(started);
  const auto deadline = std::chrono::steady_clock::now() + limits_.answersWithin;
  while (::lttng_session_daemon_alive() != 1) {
    const bool isGone = !process_->isAlive();
    if (isGone || std::chrono::steady_clock::now() > deadline) {
      end();
      return isGone ? "lttng-sessiond ended at once" : "lttng-sessiond does not answer";
    }
    std::this_thread::sleep_for(kLookEvery);
  }
  return std::nullopt;
}

void SessionDaemon::end() {
  if (!process_.has_value()) return;
  process_->end(limits_.endsWithin);
  keeper_.release();
  forget();
}

void SessionDaemon::leave() {
  if (!process_.has_value()) return;
  // Another one does the work of one that was killed.
  if (!keeper_.release() && process_->isAlive() &&
      !keeper_.keep({noteFile_, ownSessions_}, *process_)) {
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
