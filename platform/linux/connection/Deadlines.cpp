#include "platform/linux/connection/Deadlines.h"

#include <sys/epoll.h>
#include <sys/timerfd.h>

namespace halvox::platform::linux_ {

void Deadline::stop() {
  if (queue_ != nullptr) queue_->remove(*this);
}

void DeadlineQueue::start(Deadline& deadline) {
  if (deadline.isRunning()) return;
  deadline.at_ = Clock::now() + delay_;
  deadline.queue_ = this;
  deadline.previous_ = last_;
  (last_ != nullptr ? last_->next_ : first_) = &deadline;
  last_ = &deadline;
}

std::optional<DeadlineQueue::Clock::time_point> DeadlineQueue::first() const {
  if (first_ == nullptr) return std::nullopt;
  return first_->at_;
}

void DeadlineQueue::expire(Clock::time_point now) {
  while (first_ != nullptr && first_->at_ <= now) {
    Deadline& due = *first_;
    // Remove the deadline first, because its owner may start the deadline again or destroy it.
    remove(due);
    due.owner_.onDeadline();
  }
}

void DeadlineQueue::remove(Deadline& deadline) {
  (deadline.previous_ != nullptr ? deadline.previous_->next_ : first_) = deadline.next_;
  (deadline.next_ != nullptr ? deadline.next_->previous_ : last_) = deadline.previous_;
  deadline.previous_ = nullptr;
  deadline.next_ = nullptr;
  deadline.queue_ = nullptr;
}

bool LoopTimer::open(EventLoop& loop) {
  fd_.reset(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK));
  return fd_ && loop.watch(fd_.get(), EPOLLIN, *this);
}

void LoopTimer::arrange(std::optional<std::chrono::steady_clock::time_point> due, Before before) {
  const bool tooLate = due.has_value() && (!setTo_.has_value() || *setTo_ > *due);
  // Disable a useless timer only before a sleep. Until then it costs nothing.
  const bool needless = !due.has_value() && setTo_.has_value() && before == Before::kSleep;
  if (tooLate || needless) set(due);
}

void LoopTimer::onReady(std::uint32_t /*events*/) {
  std::uint64_t expirations = 0;
  static_cast<void>(read(fd_.get(), &expirations, sizeof expirations));
  setTo_.reset();
}

void LoopTimer::set(std::optional<std::chrono::steady_clock::time_point> due) {
  itimerspec setting{};
  if (due.has_value()) {
    using std::chrono::nanoseconds;
    // On Linux the steady clock is CLOCK_MONOTONIC. Its times can therefore be passed to the kernel
    // unchanged.
    const auto sinceStart = std::chrono::duration_cast<nanoseconds>(due->time_since_epoch());
    constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;
    setting.it_value.tv_sec = sinceStart.count() / kNanosecondsPerSecond;
    setting.it_value.tv_nsec = sinceStart.count() % kNanosecondsPerSecond;
  }
  static_cast<void>(timerfd_settime(fd_.get(), TFD_TIMER_ABSTIME, &setting, nullptr));
  setTo_ = due;
}

}  // namespace halvox::platform::linux_
