#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

// With these annotations, clang proves at compile time that shared fields are accessed only under
// their lock. For other compilers they are empty.
#if defined(__clang__)
#define HALVOX_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define HALVOX_THREAD_ANNOTATION(x)
#endif
#define HALVOX_GUARDED_BY(mutex) HALVOX_THREAD_ANNOTATION(guarded_by(mutex))
#define HALVOX_REQUIRES(mutex) HALVOX_THREAD_ANNOTATION(requires_capability(mutex))
#define HALVOX_EXCLUDES(mutex) HALVOX_THREAD_ANNOTATION(locks_excluded(mutex))

namespace halvox::platform::linux_ {

// A std::mutex with the annotations for clang's analysis.
class HALVOX_THREAD_ANNOTATION(capability("mutex")) Mutex {
 public:
  void lock() HALVOX_THREAD_ANNOTATION(acquire_capability()) { mutex_.lock(); }
  // Returns false at once if the mutex is held already.
  [[nodiscard]] bool tryLock() HALVOX_THREAD_ANNOTATION(try_acquire_capability(true)) {
    return mutex_.try_lock();
  }
  void unlock() HALVOX_THREAD_ANNOTATION(release_capability()) { mutex_.unlock(); }

 private:
  std::mutex mutex_;
};

// Holds a mutex for a scope.
class HALVOX_THREAD_ANNOTATION(scoped_lockable) MutexLock {
 public:
  explicit MutexLock(Mutex& mutex) HALVOX_THREAD_ANNOTATION(acquire_capability(mutex))
      : mutex_(mutex) {
    mutex_.lock();
  }
  ~MutexLock() HALVOX_THREAD_ANNOTATION(release_capability()) { mutex_.unlock(); }
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;

 private:
  Mutex& mutex_;
};

// A condition to wait on under a Mutex. A wait may return without a notification. Callers must
// therefore wait in a loop.
class Condition {
 public:
  void wait(Mutex& mutex) HALVOX_REQUIRES(mutex) { condition_.wait(mutex); }
  // Returns false if the deadline passed.
  bool waitUntil(Mutex& mutex, std::chrono::steady_clock::time_point deadline)
      HALVOX_REQUIRES(mutex) {
    return condition_.wait_until(mutex, deadline) == std::cv_status::no_timeout;
  }
  void notifyOne() noexcept { condition_.notify_one(); }
  void notifyAll() noexcept { condition_.notify_all(); }

 private:
  std::condition_variable_any condition_;
};

}  // namespace halvox::platform::linux_
