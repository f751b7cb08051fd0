#include "platform/linux/dispatch/DelayedJobs.h"

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

#include <asio/post.hpp>
#include <sys/timerfd.h>
#include <unistd.h>

#include "platform/linux/dispatch/DispatchPool.h"
#include "platform/linux/dispatch/DispatchThread.h"

namespace halvox::platform::linux_ {
namespace {

// The longest delay. The clock can count 292 years from the start of the machine, and adding at
// most ten years to the current time cannot overflow.
constexpr std::chrono::nanoseconds kLongestDelay = std::chrono::hours(24 * 3652);

// Uses CLOCK_MONOTONIC, which std::chrono::steady_clock reads, too. The times of steady_clock can
// therefore be passed to the timer unchanged.
int createTimer() {
  const int timer = ::timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK);
  if (timer < 0) throw std::system_error(errno, std::generic_category(), "timerfd_create");
  return timer;
}

}  // namespace

DelayedJobs::DelayedJobs(DispatchPool& pool)
    : pool_(pool), timer_(pool.context(QualityOfService::kUtility), createTimer()) {
  const MutexLock lock(mutex_);
  awaitTimer();
}

DelayedJobs::Ticket DelayedJobs::add(std::chrono::nanoseconds delay, QualityOfService quality,
                                     Job job) {
  const Time due = std::chrono::steady_clock::now() +
                   std::clamp(delay, std::chrono::nanoseconds(0), kLongestDelay);
  const MutexLock lock(mutex_);
  const Ticket ticket{due, added_++};
  if (isStopped_) {
    pool_.runner().countDiscarded(1);
    return ticket;
  }
  jobs_.emplace(ticket, Delayed{quality, std::move(job)});
  // Set the timer only if this job is the earliest one. This saves a system call for most jobs.
  if (!armedFor_.has_value() || due < *armedFor_) arm();
  return ticket;
}

void DelayedJobs::cancel(const Ticket& ticket) {
  Delayed cancelled;  // destroyed after the lock has been released
  const MutexLock lock(mutex_);
  const auto place = jobs_.find(ticket);
  if (place == jobs_.end()) return;
  cancelled = std::move(place->second);
  jobs_.erase(place);
  // Set the timer again, because it would wake the idle service for nothing. Without this, each
  // start of a session caused a wake-up nine seconds later, although its wait for back-ends had
  // ended long before.
  if (jobs_.empty() || (armedFor_.has_value() && jobs_.begin()->first.first > *armedFor_)) arm();
}

void DelayedJobs::stop() {
  std::map<Ticket, Delayed> discarded;
  {
    const MutexLock lock(mutex_);
    isStopped_ = true;
    // Destroy the jobs after the lock is released, because the destructor of an object that a job
    // holds may add jobs.
    discarded.swap(jobs_);
    asio::error_code ignored;
    timer_.cancel(ignored);
  }
  if (!discarded.empty()) pool_.runner().countDiscarded(discarded.size());
}

void DelayedJobs::arm() {
  itimerspec when{};  // all zero disables the timer
  armedFor_.reset();
  if (!jobs_.empty()) {
    armedFor_ = jobs_.begin()->first.first;
    const auto time = std::chrono::nanoseconds(armedFor_->time_since_epoch());
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    when.it_value.tv_sec = static_cast<time_t>(seconds.count());
    when.it_value.tv_nsec = static_cast<long>((time - seconds).count());
  }
  ::timerfd_settime(timer_.native_handle(), TFD_TIMER_ABSTIME, &when, nullptr);
}

void DelayedJobs::awaitTimer() {
  timer_.async_wait(asio::posix::stream_descriptor::wait_read,
                    [this](const asio::error_code& error) {
                      if (!error) onTimer();
                    });
}

void DelayedJobs::onTimer() {
  const MutexLock lock(mutex_);
  if (isStopped_) return;
  std::uint64_t expirations = 0;
  // If the timer was set again after it had expired, there is nothing to read. The timer will
  // expire again.
  if (::read(timer_.native_handle(), &expirations, sizeof(expirations)) > 0) postDue();
  awaitTimer();
}

void DelayedJobs::startDue() {
  const MutexLock lock(mutex_);
  if (!isStopped_) postDue();
}

void DelayedJobs::postDue() {
  const Time now = std::chrono::steady_clock::now();
  while (!jobs_.empty() && jobs_.begin()->first.first <= now) {
    auto node = jobs_.extract(jobs_.begin());
    // Begin the turn under the lock. The job is therefore always either delayed or counted.
    pool_.turns().begin();
    ++due_.added;
    // The job runs on a thread of its own quality, because this thread may be the one that watches
    // the timer.
    asio::post(pool_.context(node.mapped().quality),
               [this, job = std::move(node.mapped().job)]() mutable { runDue(std::move(job)); });
  }
  arm();
}

void DelayedJobs::runDue(Job job) {
  bool isStopped = false;
  {
    const MutexLock lock(mutex_);
    isStopped = isStopped_;
  }
  // Discard the job if it was posted before the stop but would run after it.
  if (isStopped) {
    pool_.runner().countDiscarded(1);
  } else {
    const DispatchThread::Working working(nullptr, "delayed");
    pool_.runner().run(job);
  }
  // Destroy the job before its turn ends, because an object that it holds may add jobs.
  job = nullptr;
  {
    const MutexLock lock(mutex_);
    ++due_.run;
  }
  pool_.turns().end();
}

QueueLabels::Jobs DelayedJobs::dueJobs() {
  const MutexLock lock(mutex_);
  return due_;
}

}  // namespace halvox::platform::linux_
