#pragma once

#include <mutex>
#include <utility>

namespace halvox {

// A value that can be reached only while its lock is held. Any thread may call. The lock is not
// recursive; hold it briefly, and never while waiting, logging or calling back.
template <typename T>
class Guarded {
 public:
  // The value, locked for as long as this object lives.
  class Lock {
   public:
    T& operator*() const { return value_; }
    T* operator->() const { return &value_; }

   private:
    friend class Guarded;
    explicit Lock(const Guarded& guarded) : held_(guarded.mutex_), value_(guarded.value_) {}
    std::lock_guard<std::mutex> held_;
    T& value_;  // owned by the Guarded that made this lock
  };

  Guarded() = default;
  explicit Guarded(T value) : value_(std::move(value)) {}

  [[nodiscard]] Lock lock() const { return Lock(*this); }
  // Returns a copy of the value.
  [[nodiscard]] T copy() const { return *lock(); }
  // Replaces the value. The old value is destroyed after the lock has been released.
  void set(T value) {
    Lock locked(*this);
    std::swap(*locked, value);
  }
  // Returns the value and leaves an empty one.
  [[nodiscard]] T take() {
    T taken{};
    Lock locked(*this);
    std::swap(*locked, taken);
    return taken;
  }

 private:
  mutable std::mutex mutex_;
  mutable T value_{};
};

}  // namespace halvox
