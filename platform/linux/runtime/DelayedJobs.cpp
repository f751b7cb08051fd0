#include "platform/linux/runtime/DelayedJobs.h"

#include <algorithm>
#include <utility>

#include <asio/post.hpp>

namespace halvox::platform::linux_ {
namespace {

// Far below the end of the clock, which is some 292 years after the start of the machine.
constexpr std::chrono::nanoseconds kLongestDelay = std::chrono::hours(24 * 3652);

}  // namespace

DelayedJobs::DelayedJobs(asio::io_context& context, JobRunner& runner)
    : context_(context), runner_(runner), timer_(context) {}

DelayedJobs::Ticket DelayedJobs::add(std::chrono::nanoseconds delay, Job job) {
  const Time due = std::chrono::steady_clock::now() +
                   std::clamp(delay, std::chrono::nanoseconds(0), kLongestDelay);
  const MutexLock lock(mutex_);
  const Ticket ticket{due, added_++};
  if (isStopped_) {
    runner_.countDiscarded(1);
    return ticket;
  }
  jobs_.emplace(ticket, std::move(job));
  if (!armedFor_.has_value() || due < *armedFor_) arm();
  return ticket;
}

void DelayedJobs::cancel(const Ticket& ticket) {
  Job cancelled;  // goes when the lock is no longer held
  const MutexLock lock(mutex_);
  const auto place = jobs_.find(ticket);
  if (place == jobs_.end()) return;
  cancelled = std::move(place->second);
  jobs_.erase(place);
}

void DelayedJobs::stop() {
  std::map<Ticket, Job> discarded;
  {
    const MutexLock lock(mutex_);
    isStopped_ = true;
    discarded.swap(jobs_);
    timer_.cancel();
  }
  if (!discarded.empty()) runner_.countDiscarded(discarded.size());
}

// Sets the timer to the earliest job, in the place of what it waited for.
void DelayedJobs::arm() {
  armedFor_ = jobs_.begin()->first.first;
  timer_.expires_at(*armedFor_);
  timer_.async_wait([this](const asio::error_code& error) {
    if (!error) onTimer();
  });
}

void DelayedJobs::onTimer() {
  const MutexLock lock(mutex_);
  armedFor_.reset();
  const Time now = std::chrono::steady_clock::now();
  while (!jobs_.empty() && jobs_.begin()->first.first <= now) {
    auto node = jobs_.extract(jobs_.begin());
    asio::post(context_, [this, job = std::move(node.mapped())] { runDue(job); });
  }
  if (!jobs_.empty()) arm();
}

void DelayedJobs::runDue(const Job& job) {
  bool isStopped = false;
  {
    const MutexLock lock(mutex_);
    isStopped = isStopped_;
  }
  if (isStopped) return runner_.countDiscarded(1);
  const JobRunner::Scope scope(nullptr);
  runner_.run(job);
}

}  // namespace halvox::platform::linux_
